#include "device/bodies/device.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <memory>
#include <stdexcept>

#include "device/bodies/reachable.h"
#include "device/bodies/text_file.h"

namespace Device {

namespace {

namespace fs = std::filesystem;

constexpr char kArchiverName[] = "kavo-7z";

std::unique_ptr<OpenDevice>& Instance() {
  static std::unique_ptr<OpenDevice> device;
  return device;
}

// The device's own archiver stands beside its executable. It is kept open, as the users may not be
// able to walk there.
FileDescriptor OpenArchiver() {
  const fs::path path = fs::read_symlink("/proc/self/exe").parent_path() / kArchiverName;
  FileDescriptor file(open(path.c_str(), O_PATH | O_CLOEXEC));
  if (!file) {
    throw std::system_error(errno, std::generic_category(), "archiver " + path.string());
  }
  return file;
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
  }
  device->archiver = OpenArchiver();
  device->switches_identity = geteuid() == 0;
  if (device->switches_identity) {
    MakeReachable(device->root);
  } else {
    std::cerr << "kavo-device: not root: every user of the device is you\n";
  }
  return device;
}

}  // namespace

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
