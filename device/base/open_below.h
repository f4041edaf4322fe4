// Opening files by paths of users', who can rename and replace what lies there at any moment.
#pragma once

#include <string>
#include <vector>

#include "device/base/file_descriptor.h"

namespace Device {

// Opens what `path`, relative and without "..", names below the folder, and follows no link on the
// way there: a link under the last name is opened itself with O_PATH, and refused without. Invalid,
// with errno, when it cannot; ELOOP for a link on the way.
FileDescriptor OpenBelow(int folder, const std::string& path, int flags);

// The same for an absolute path, from the innermost of the `fixed` folders that it lies in: folders
// that no user can rename or replace. Where it lies in none, from the folder below the top one.
FileDescriptor OpenUserPath(const std::vector<std::string>& fixed, const std::string& path,
                            int flags);

// True of the folder itself too.
bool IsWithin(const std::string& path, const std::string& folder);

// By which a program opens again what it has as a descriptor.
inline std::string PathOf(int fd) { return "/proc/self/fd/" + std::to_string(fd); }

}  // namespace Device
