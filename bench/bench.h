// What the rows of the benchmark share: two sides run by turns, and a device with files to pack.
#ifndef BENCH_BENCH_H_
#define BENCH_BENCH_H_

#include <filesystem>
#include <functional>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "bench/table.h"
#include "device/host/launcher.h"

namespace Bench {

namespace fs = std::filesystem;
using Strings = std::vector<std::string>;

// Runs both sides by turns, A B A B, after a first run of each that does not count. Each side
// returns the seconds it took.
Medians Compare(const std::function<double()>& ours, const std::function<double()>& theirs,
                std::size_t pairs);
double Seconds(const std::function<void()>& body);

// Throws std::runtime_error that says what does not hold.
void Require(bool holds, const std::string& what);

// A device with the shared folders photo and music, and a user, alice. One in a process.
class Workbench {
 public:
  explicit Workbench(const fs::path& folder);

  fs::path Share(const std::string& name) const { return folder_ / "device/vol1" / name; }
  // Names of files that are made in the folder, unless they are there: of random bytes, or sparse.
  Strings AddFiles(const fs::path& folder, std::size_t count, std::size_t size,
                   bool is_sparse = false);

  // The request to make /photo/out, which is not there then, of the sources.
  Device::Request Prepare(const Strings& sources, const std::string& format,
                          const std::string& level) const;
  // The task's id.
  std::string Start(const Device::Request& request);
  Device::Outcome Ask(const std::string& method, const std::string& task_id);
  // Until "status" says finished. Throws when the job failed.
  void Finish(const std::string& task_id);
  double Job(const Strings& sources, const std::string& format, const std::string& level);
  // The stock 7z with a list of names, in that folder.
  double Bare(const fs::path& folder, const Strings& names, Strings switches);

 private:
  const fs::path folder_;
  std::mt19937_64 random_;
  std::optional<Device::Launcher> launcher_;
  std::string session_;
};

}  // namespace Bench

#endif  // BENCH_BENCH_H_
