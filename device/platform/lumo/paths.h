// User paths resolved by text.
#pragma once

#include <string>

#include "device/model/device.h"

namespace Device {

struct ResolvedPath {
  int error = 0;          // a KAVO::ErrorCode; the rest counts when it is 0
  std::string user_path;  // without ".", ".." and doubled slashes
  std::string real_path;  // full path
  std::string share_name;
  std::string share_real_path;
  std::string volume_path;
  const Share* share = nullptr;  // null for a home
};

// Resolves the path as that user sees it. ".." may not lead out of the shared folder. Nothing need
// exist.
ResolvedPath Resolve(const std::string& user, const std::string& path);

// What the user may do on the shared folder that the path was resolved to.
Access AccessOf(const ResolvedPath& path, const std::string& user);

// The folder in which this process's job has its sources, when they lie in one shared folder: what
// FindCommonParent answered. Without a slash at the end; empty before.
const std::string& SourcesFolder();

}  // namespace Device
