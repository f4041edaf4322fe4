#pragma once

#include <map>
#include <string>
#include <unordered_set>
#include <vector>

namespace Archiver {

// Where 7z runs so that it finds the sources under the names which the archive is to give them.
struct WorkPlace {
  std::string folder;  // real path
  // Real paths of the first parts of sources that are links of a staging folder, when only
  // following links leads through them; empty otherwise.
  std::map<std::string, std::string> shares;
};

// The caller packs from a share, where every link is user data and stays a link; or from a staging
// folder, told by the list file in it, whose own links stand for the shares. 7z follows all links
// or none. Shares that lie in one folder under their own names are packed from there, without any
// link; only what is scattered needs following.
WorkPlace FindWorkPlace(const std::vector<std::string>& sources, const std::string& list_path);

// The sources that are no plain files. Throws Failure for a source that is missing or lies behind a
// link other than those of a staging folder. 7z overlooks both when the name has a '*' or '?', for
// all that it matches literally.
std::unordered_set<std::string> CheckSources(const WorkPlace& place,
                                             const std::vector<std::string>& sources);

// The names, relative to the place, under which 7z can come across `path`, an absolute one.
std::vector<std::string> NamesWithin(const WorkPlace& place, const std::string& path);

}  // namespace Archiver
