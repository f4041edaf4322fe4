// kavo-bench-reader: the archiver's lines through the reader, beside memchr over the same bytes.
// Prints the table's row.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <memory>
#include <string>

#include "bench/table.h"
#include "compress/archiver_output.h"

namespace {

constexpr char kReader[] = "reader";
constexpr char kMemchr[] = "memchr";

// What an archiver that names each file prints for a job of many.
const std::string& Lines() {
  static const std::string lines = [] {
    std::string text = "Total: 5000000000\n";
    for (int file = 0; file < 100000; ++file) {
      text += "Compressing photo/a folder/file-number-" + std::to_string(file) + ".dat\n";
      text += file % 1000 == 0 ? "Progress: " + std::to_string(file / 1000) + "\n" : "";
    }
    return text;
  }();
  return lines;
}

void Reader(benchmark::State& state) {
  std::string bytes = Lines();
  char* line = nullptr;
  std::size_t size = 0;
  for (auto _ : state) {  // NOLINT(clang-analyzer-deadcode.DeadStores)
    const std::unique_ptr<FILE, int (*)(FILE*)> output(fmemopen(bytes.data(), bytes.size(), "r"),
                                                       std::fclose);
    for (ssize_t length = 0; (length = getline(&line, &size, output.get())) != -1;) {
      benchmark::DoNotOptimize(Zantro::ParseArchiverLine({line, static_cast<std::size_t>(length)}));
    }
  }
  std::free(line);
}
BENCHMARK(Reader)->Name(kReader);

void Memchr(benchmark::State& state) {
  const std::string& bytes = Lines();
  for (auto _ : state) {  // NOLINT(clang-analyzer-deadcode.DeadStores)
    const char* const end = bytes.data() + bytes.size();
    for (const char* at = bytes.data(); at != end;) {
      const auto* const feed =
          static_cast<const char*>(std::memchr(at, '\n', static_cast<std::size_t>(end - at)));
      benchmark::DoNotOptimize(feed);
      at = feed + 1;
    }
  }
}
BENCHMARK(Memchr)->Name(kMemchr);

// Keeps the medians, in seconds.
class Medians : public benchmark::BenchmarkReporter {
 public:
  bool ReportContext(const Context& /*context*/) override { return true; }
  void ReportRuns(const std::vector<Run>& runs) override {
    for (const Run& run : runs) {
      if (run.aggregate_name == "median") {
        constexpr double kNano = 1e-9;
        seconds[run.run_name.function_name] = kNano * run.GetAdjustedRealTime();
      }
    }
  }
  std::map<std::string, double> seconds;
};

}  // namespace

int main() {
  std::string name = "kavo-bench-reader";
  std::string repetitions = "--benchmark_repetitions=11";
  std::string by_turns = "--benchmark_enable_random_interleaving=true";
  char* arguments[] = {name.data(), repetitions.data(), by_turns.data()};
  int count = 3;
  benchmark::Initialize(&count, arguments);
  Medians medians;
  benchmark::RunSpecifiedBenchmarks(&medians);
  const double ours = medians.seconds[kReader];
  const double theirs = medians.seconds[kMemchr];
  Bench::PrintRow("the archiver's lines through the reader, beside memchr",
                  Bench::Milliseconds(ours), Bench::Milliseconds(theirs), ours / theirs, "10");
}
