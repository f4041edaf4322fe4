#pragma once

#include <map>
#include <string>
#include <vector>

#include "device/archiver/list_file.h"
#include "device/archiver/target.h"
#include "device/base/fence.h"
#include "device/base/file_descriptor.h"

namespace Archiver {

// Where 7z runs so that it finds the sources under the names which the archive is to give them.
struct WorkPlace {
  Device::FileDescriptor folder;
  // By a source's first part: the shared folder, where 7z gets there only by following the staging
  // folder's link. Empty when 7z follows none.
  std::map<std::string, Device::FileDescriptor> shares;
};

// The caller packs from the working directory, in a share, where every link is user data and stays
// a link; or from a staging folder, told by the list file in it, whose own links stand for the
// shares. 7z follows all links or none. Shares that lie in one folder under their own names are
// packed from there, without any link; only what is scattered needs following.
WorkPlace FindWorkPlace(const std::vector<std::string>& sources, const std::string& list_path);

// A source, or what lies below one, opened as a path (O_PATH). Follows no link but those of a
// staging folder. Throws Failure.
Device::FileDescriptor OpenSource(const WorkPlace& place, const std::string& source);

// Opens each source and allows it to 7z: nothing that takes its place afterwards is allowed.
// Returns those that are no plain files. Throws Failure for a source that is missing or lies
// behind a link other than those of a staging folder. 7z overlooks both when the name has a '*' or
// '?', for all that it matches literally.
Identities AllowSources(const WorkPlace& place, const std::vector<std::string>& sources,
                        Device::Fence& fence);

// Throws Failure when one of the sources was exchanged since: what 7z has packed under its name can
// be another one's.
void CheckIdentities(const WorkPlace& place, const Identities& sources);

// The names, relative to the place, under which 7z can come across the target.
std::vector<std::string> NamesOf(const WorkPlace& place, const Target& target);

}  // namespace Archiver
