// How much memory the machine has.

#include <sys/resource.h>
#include <sys/sysinfo.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <string>

#include "device/model/device.h"

namespace Device {

namespace {

// The least limit of a group and those that it is in. What is no number, "max", limits nothing.
std::uint64_t LimitOfGroup(const std::string& mount, std::filesystem::path group,
                           const std::string& file) {
  std::uint64_t least = RLIM_INFINITY;
  for (bool is_root = false; !is_root; group = group.parent_path()) {
    is_root = !group.has_relative_path();
    std::uint64_t limit = 0;
    if (std::ifstream(mount + group.string() + "/" + file) >> limit) {
      least = std::min(least, limit);
    }
  }
  return least;
}

}  // namespace

std::uint64_t InstalledMemory() {
  struct sysinfo machine {};
  sysinfo(&machine);
  rlimit address_space{};
  getrlimit(RLIMIT_AS, &address_space);
  std::uint64_t memory = std::min<std::uint64_t>(std::uint64_t{machine.totalram} * machine.mem_unit,
                                                 address_space.rlim_cur);
  // Lines "NUMBER:CONTROLLERS:PATH", of the second version "0::PATH".
  std::ifstream groups("/proc/self/cgroup");
  std::string number;
  std::string controllers;
  std::string path;
  while (std::getline(groups, number, ':') && std::getline(groups, controllers, ':') &&
         std::getline(groups, path)) {
    if (controllers.empty()) {
      memory = std::min(memory, LimitOfGroup("/sys/fs/cgroup", path, "memory.max"));
    } else if (controllers == "memory") {
      memory =
          std::min(memory, LimitOfGroup("/sys/fs/cgroup/memory", path, "memory.limit_in_bytes"));
    }
  }
  return memory;
}

}  // namespace Device
