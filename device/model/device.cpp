#include "device/model/device.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <memory>
#include <stdexcept>

#include "device/base/archiver_call.h"
#include "device/base/file_io.h"
#include "device/base/open_below.h"

namespace Device {

namespace {

namespace fs = std::filesystem;

constexpr char kArchiverName[] = "kavo-7z";
constexpr char kModuleName[] = "KAVO.Zantro.Compress.so";

std::unique_ptr<OpenDevice>& Instance() {
  static std::unique_ptr<OpenDevice> device;
  return device;
}

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

// When a folder above `root` is closed to others (a home of mode 0700), lets this process and those
// forked from it see that folder as one that holds the device alone and is open to walk through.
// The rest of the machine sees no change. Needs root. Throws std::runtime_error that names the
// folder.
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

Config ReadConfig(const fs::path& root) {
  const std::string text = ReadTextFile((root / kConfigFile).string());
  try {
    return ParseConfig(text);
  } catch (const std::exception& error) {
    throw std::runtime_error(std::string(kConfigFile) + ": " + error.what());
  }
}

std::unique_ptr<OpenDevice> OpenFolder(const std::string& folder) {
  auto device = std::make_unique<OpenDevice>();
  std::error_code error;
  device->root = fs::canonical(folder, error).string();
  if (error) {
    throw std::runtime_error(error.message());
  }
  device->config = ReadConfig(device->root);
  for (const std::string& volume : device->config.volumes) {
    if (!fs::is_directory(device->VolumePath(volume))) {
      throw std::runtime_error("volume '" + volume + "': no such folder");
    }
    device->real_volumes.push_back(fs::canonical(device->VolumePath(volume)).string());
  }
  // Opened at once: later there may be no way to walk there.
  device->archiver = OpenBesideProgram(kArchiverName, O_PATH);
  device->zip_program = OpenBesideProgram(kZipProgramName, O_PATH);
  device->link_free = OpenBesideProgram(kLinkFreeName, O_PATH);
  device->module = OpenBesideProgram(kModuleName, O_RDONLY);
  constexpr mode_t kPrivate = 0600;
  const std::string queue = device->root + "/" + kQueueFile;
  device->queue = FileDescriptor(open(queue.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, kPrivate));
  if (!device->queue) {
    ThrowErrno(queue);
  }
  device->switches_identity = geteuid() == 0;
  if (device->switches_identity) {
    MakeReachable(device->root);
  }
  return device;
}

}  // namespace

std::vector<std::string> OpenDevice::FixedFolders(const std::string& user) const {
  std::vector<std::string> folders;
  for (const std::string& volume : config.volumes) {
    folders.push_back(VolumePath(volume));
  }
  for (const Share& share : config.shares) {
    folders.push_back(SharePath(share));
  }
  if (const User* const owner = config.FindUser(user)) {
    folders.push_back(HomePath(*owner));
  }
  return folders;
}

OpenDevice& Open(const std::string& folder) {
  try {
    Instance() = OpenFolder(folder);
  } catch (const std::exception& error) {
    throw std::runtime_error("cannot open device '" + folder + "': " + error.what());
  }
  return *Instance();
}

OpenDevice& TheDevice() {
  if (Instance() == nullptr) {
    throw std::logic_error("no device is open");
  }
  return *Instance();
}

}  // namespace Device
