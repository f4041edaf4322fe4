// What is in an archive.
#pragma once

#include <string>

#include "device/host/user_file.h"

namespace Device {

// Lists a zip or 7z as 7z does, which is fenced and has the request's memory at the most:
// {"format", "entries": [{"kind", "modified", "name", "size"}], "count", "size", "complete",
// "encrypted"}. Not complete beyond 10,000 entries, when patience ended before, or where the
// archive is damaged. To be called with the user's identity. Throws Refused.
std::string ListArchive(const std::string& user, const std::string& path, const Patience& patience);

}  // namespace Device
