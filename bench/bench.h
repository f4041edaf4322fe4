// What the rows of the benchmark share: a device with files to pack, and the two ways to pack them.
#pragma once

#include <filesystem>
#include <functional>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "bench/turns.h"
#include "device/host/launcher.h"

namespace Bench {

namespace fs = std::filesystem;
using Strings = std::vector<std::string>;

// A device with the shared folders photo and music, and a user, alice. One in a process.
class Workbench {
 public:
  explicit Workbench(const fs::path& folder);

  fs::path Share(const std::string& name) const { return folder_ / "device/vol1" / name; }
  // Names of files that are made in the folder, unless they are there: of random bytes, or sparse.
  Strings AddFiles(const fs::path& folder, std::size_t count, std::size_t size,
                   bool is_sparse = false);

  // The request to make /photo/out of the sources.
  Device::Request RequestFor(const Strings& sources, const std::string& format,
                             const std::string& level) const;
  void RemoveArchive() const;
  // The task's id.
  std::string Start(const Device::Request& request);
  // Of the task that was started, when no other process is this one's child.
  static pid_t Worker();
  Device::Outcome Ask(const std::string& method, const std::string& task_id);

  // A job from "start" until "status" says finished.
  Side Job(const Strings& sources, const std::string& format, const std::string& level);
  // The stock 7z with a list of names, in that folder. `name` is of what it leaves.
  Side Bare(const fs::path& folder, const Strings& names, Strings switches,
            const std::string& name = "bare") const;

 private:
  const fs::path folder_;
  std::mt19937_64 random_;
  std::optional<Device::Launcher> launcher_;
  std::string session_;
};

}  // namespace Bench
