// The folders of a user's shared folders, as the user sees them.
#pragma once

#include <sys/stat.h>

#include <string>

namespace Device {

// Lists a user's folder, "/" for the shared folders, in JSON: {"entries": [{"kind", "modified",
// "name", "size"}], "path", "writable"}. To be called with the user's identity, by which the kernel
// decides. Links are listed, and not followed. Throws Refused.
std::string ListFolder(const std::string& user, const std::string& path);

// Appends such an entry.
void AddEntry(std::string& entries, const std::string& name, const struct stat& status);

}  // namespace Device
