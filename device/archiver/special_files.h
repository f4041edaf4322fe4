#pragma once

#include <string>
#include <vector>

#include "device/archiver/work_place.h"

namespace Archiver {

// What lies among and below `sources` that 7z must not open: pipes, sockets and devices, at which
// it waits for data, and where it follows links, every link but those of the staging folder.
// Folders of an excluded name stay closed. Throws Failure for what cannot be read.
std::vector<std::string> FindSpecials(const WorkPlace& place,
                                      const std::vector<std::string>& sources,
                                      const std::vector<std::string>& excluded);

// Makes a folder in the work folder with copies of such links at their places, empty files for the
// rest, and nothing else but the folders on the way: what a 7z that follows no links can safely
// pack. Throws Failure.
Device::FileDescriptor MirrorSpecials(const WorkPlace& place,
                                      const std::vector<std::string>& specials, int work_folder);

}  // namespace Archiver
