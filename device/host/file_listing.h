// The folders of a user's shared folders, as the user sees them.
#pragma once

#include <string>

namespace Device {

struct Listing {
  int error = 0;  // a KAVO::ErrorCode; 0: listed
  // JSON: {"entries": [{"kind", "modified", "name", "size"}], "path", "writable"}
  std::string body = {};
};

// Lists a user's folder, "/" for the shared folders. To be called with the user's identity, by
// which the kernel decides. Links are listed, and not followed.
Listing ListFolder(const std::string& user, const std::string& path);

}  // namespace Device
