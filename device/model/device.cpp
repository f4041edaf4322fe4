#include "device/model/device.h"

#include <fcntl.h>
#include <unistd.h>

#include <filesystem>
#include <memory>
#include <stdexcept>

#include "device/base/file_io.h"
#include "device/model/reachable.h"

namespace Device {

namespace {

namespace fs = std::filesystem;

constexpr char kArchiverName[] = "kavo-7z";
constexpr char kZipProgramName[] = "kavo-zip";
constexpr char kModuleName[] = "KAVO.Zantro.Compress.so";

std::unique_ptr<OpenDevice>& Instance() {
  static std::unique_ptr<OpenDevice> device;
  return device;
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
