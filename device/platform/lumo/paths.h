// User paths resolved by text.
#pragma once

#include <string>

#include "device/model/device.h"
#include "platform/lumo/file_manager.h"

namespace Device {

// Its user path is without ".", ".." and doubled slashes.
struct ResolvedPath : PathInfo {
  int error = 0;                 // a KAVO::ErrorCode; the rest counts when it is 0
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
