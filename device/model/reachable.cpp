#include "device/model/reachable.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <stdexcept>

#include "device/base/file_descriptor.h"
#include "device/base/open_below.h"

namespace Device {

namespace {

namespace fs = std::filesystem;

bool IsOpenToAll(const fs::path& folder) {
  return (fs::status(folder).permissions() & fs::perms::others_exec) != fs::perms::none;
}

// The topmost folder above `root` that others cannot pass through, empty when there is none.
fs::path FindClosedFolder(const fs::path& root) {
  fs::path folder;
  for (const fs::path& part : root.parent_path()) {
    folder /= part;
    if (!IsOpenToAll(folder)) {
      return folder;
    }
  }
  return {};
}

// Puts an empty folder in place of `closed` and the device back where it was.
bool Replace(const fs::path& closed, const fs::path& root) {
  // What is mounted later elsewhere still shows here, and nothing of this shows there.
  if (unshare(CLONE_NEWNS) != 0 || mount(nullptr, "/", nullptr, MS_REC | MS_SLAVE, nullptr) != 0) {
    return false;
  }
  const FileDescriptor device(open(root.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  const std::string source = PathOf(device.Get());
  if (mount("kavo-device", closed.c_str(), "tmpfs", 0, "mode=0755,size=1m") != 0) {
    return false;
  }
  std::error_code error;
  fs::create_directories(root, error);
  return !error && mount(source.c_str(), root.c_str(), nullptr, MS_BIND | MS_REC, nullptr) == 0;
}

}  // namespace

void MakeReachable(const std::string& root) {
  const fs::path closed = FindClosedFolder(root);
  if (closed.empty()) {
    return;
  }
  const mode_t mask = umask(0022);
  const bool is_replaced = Replace(closed, root);
  const int error = errno;
  umask(mask);
  if (!is_replaced) {
    throw std::runtime_error("users cannot walk through '" + closed.string() +
                             "', and no view of its own could be made: " + std::strerror(error));
  }
}

}  // namespace Device
