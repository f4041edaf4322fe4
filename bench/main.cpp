// kavo-bench FOLDER [ROW]...: what the module costs beside the least that does the same. Prints the
// table's rows, all or those named, and leaves in FOLDER/growth the cost against the number of
// sources, for the plot.
#include <poll.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cmath>
#include <fstream>
#include <iomanip>
#include <iostream>
#include <map>
#include <set>
#include <sstream>

#include "bench/bench.h"
#include "device/model/device.h"
#include "platform/klib/system.h"

namespace Bench {
namespace {

constexpr std::size_t kRounds = 11;  // of what takes seconds; more of the rest
constexpr std::size_t kMiB = std::size_t{1} << 20U;
const Strings kZip = {"-tzip", "-mx6"};
const Strings kStore = {"-tzip", "-mx0"};
const Strings kSevenZip = {"-t7z", "-mx6"};

void TinyFile(Workbench& bench) {
  bench.AddFiles(bench.Share("photo/tiny"), 1, 1024);
  const Side ours = bench.Job({"/photo/tiny"}, "zip", "normal");
  const Side theirs = bench.Bare(bench.Share("photo"), {"tiny"}, kZip);
  PrintRow("one file of 1 KiB, until \"status\" says finished",
           Compare([&] { return RunAlone(ours); }, [&] { return RunAlone(theirs); }, 3 * kRounds),
           "2.5");
}

Medians CompareJob(Workbench& bench, const Side& job, const fs::path& folder, const Strings& names,
                   const Strings& switches) {
  return CompareSideBySide(job, bench.Bare(folder, names, switches),
                           bench.Bare(folder, names, switches, "again"), kRounds);
}

void Album(Workbench& bench) {
  bench.AddFiles(bench.Share("photo/album"), 200, 3 * kMiB);
  PrintRow("200 incompressible files of 3 MiB, zip",
           CompareJob(bench, bench.Job({"/photo/album"}, "zip", "normal"), bench.Share("photo"),
                      {"album"}, kZip),
           "1.02");
}

void Tree(Workbench& bench) {
  bench.AddFiles(bench.Share("photo/tree"), 20000, 200);
  for (const auto& [format, switches] : {std::pair("zip", kZip), std::pair("7z", kSevenZip)}) {
    PrintRow(std::string("20,000 small files, ") + format,
             CompareJob(bench, bench.Job({"/photo/tree"}, format, "normal"), bench.Share("photo"),
                        {"tree"}, switches),
             "1.03");
  }
}

void LargeFile(Workbench& bench) {
  bench.AddFiles(bench.Share("photo/large"), 1, 2048 * kMiB, true);
  PrintRow("one file of 2 GiB, \"store\"",
           CompareJob(bench, bench.Job({"/photo/large"}, "zip", "store"), bench.Share("photo"),
                      {"large"}, kStore),
           "1.02");
}

void TwoShares(Workbench& bench) {
  const fs::path stage = bench.Share("stage");
  fs::create_directories(stage);
  for (const char* share : {"photo", "music"}) {
    bench.AddFiles(bench.Share(share) / "half", 10000, 200);
    fs::create_directory_symlink(bench.Share(share), stage / share);
  }
  Strings with = kZip;
  with.push_back("-l");
  PrintRow("two shared folders, 10,000 small files each",
           CompareJob(bench, bench.Job({"/photo/half", "/music/half"}, "zip", "normal"), stage,
                      {"photo/half", "music/half"}, with),
           "1.05");
}

Medians CompareSources(Workbench& bench, const std::string& folder, std::size_t count,
                       std::size_t size) {
  const fs::path place = bench.Share("photo") / folder;
  const Strings names = bench.AddFiles(place, count, size);
  Strings sources;
  for (const std::string& name : names) {
    sources.push_back("/photo/" + folder + "/" + name);
  }
  return CompareJob(bench, bench.Job(sources, "zip", "normal"), place, names, kZip);
}

// With the exponent of the cost's growth between the first and the last number.
void ManySources(Workbench& bench, const fs::path& folder) {
  constexpr std::size_t kDocument = 8192;
  PrintRow("100,000 sources named one by one, of 8 KiB",
           CompareSources(bench, "documents", 100000, kDocument), "1.10");
  std::ofstream growth(folder / "growth");
  std::map<std::size_t, Medians> all;
  for (const std::size_t count : {1000U, 3000U, 10000U, 30000U, 100000U}) {
    all[count] = CompareSources(bench, "many", count, 100);
    growth << count << ' ' << all[count].ours << ' ' << all[count].theirs << std::endl;
  }
  PrintRow("100,000 sources named one by one, of 100 bytes", all[100000], "1.10");
  const auto exponent = [&](double Medians::*side) {
    return std::log(all[100000].*side / all[1000].*side) / std::log(100.0);
  };
  std::ostringstream ours;
  std::ostringstream theirs;
  ours << "n^" << std::setprecision(3) << exponent(&Medians::ours);
  theirs << "n^" << std::setprecision(3) << exponent(&Medians::theirs);
  PrintRow("growth from 1,000 to 100,000 sources of 100 bytes (the exponent)", ours.str(),
           theirs.str(), exponent(&Medians::ours), "1.1");
}

// A process that does one thing with a database, and its end awaited.
double ForkAndRun(const fs::path& database, const char* sql) {
  return Seconds([&] {
    const pid_t pid = fork();
    if (pid == 0) {
      sqlite3* connection = nullptr;
      // Like the device's own connections, it does not write its log back at its end.
      const bool is_done = sqlite3_open(database.c_str(), &connection) == SQLITE_OK &&
                           sqlite3_db_config(connection, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1,
                                             nullptr) == SQLITE_OK &&
                           sqlite3_exec(connection, sql, nullptr, nullptr, nullptr) == SQLITE_OK;
      sqlite3_close(connection);
      _exit(is_done ? 0 : 1);
    }
    int status = 0;
    Require(waitpid(pid, &status, 0) == pid && status == 0, "database");
  });
}

void Answers(Workbench& bench, const fs::path& folder) {
  constexpr std::size_t kTries = 101;
  const fs::path database = folder / "least.db";
  ForkAndRun(database,
             "PRAGMA journal_mode = WAL; CREATE TABLE rows (id INTEGER PRIMARY KEY, "
             "value TEXT); INSERT INTO rows VALUES (1, 'value');");
  bench.AddFiles(bench.Share("photo/endless"), 1, std::size_t{1} << 40U, true);
  PrintRow("the answer of \"start\"",
           Compare(
               [&] {
                 std::string id;
                 bench.RemoveArchive();
                 const Device::Request request = bench.RequestFor({"/photo/endless"}, "7z", "best");
                 const double seconds = Seconds([&] { id = bench.Start(request); });
                 bench.Ask("stop", id);
                 return seconds;
               },
               [&] {
                 return ForkAndRun(database,
                                   "PRAGMA synchronous = NORMAL; "
                                   "INSERT INTO rows (value) VALUES ('value');");
               },
               kTries),
           "3");
  const std::string id = bench.Start(bench.RequestFor({"/photo/endless"}, "7z", "best"));
  PrintRow(
      "\"status\"",
      Compare(
          [&] { return Seconds([&] { Require(bench.Ask("status", id).code == 0, "status"); }); },
          [&] { return ForkAndRun(database, "SELECT value FROM rows WHERE id = 1;"); }, kTries),
      "2");
  bench.Ask("stop", id);
}

// Memory of the process that no other shares, in bytes.
double PrivateBytes(pid_t pid) {
  std::ifstream file("/proc/" + std::to_string(pid) + "/smaps_rollup");
  double kilobytes = 0;
  for (std::string line; std::getline(file, line);) {
    if (line.rfind("Private_", 0) == 0) {
      kilobytes += std::stod(line.substr(line.find(':') + 1));
    }
  }
  return 1024 * kilobytes;
}

// True once the worker has a child.
bool HasArchiver(pid_t worker) {
  const std::string id = std::to_string(worker);
  std::ifstream children("/proc/" + id + "/task/" + id + "/children");
  pid_t child = 0;
  return static_cast<bool>(children >> child);
}

void WorkerMemory(Workbench& bench) {
  bench.AddFiles(bench.Share("photo/endless"), 1, std::size_t{1} << 40U, true);
  const std::size_t count = 100000;
  Strings many = {"/photo/endless"};
  double bytes_of_paths = 0;
  for (const std::string& name : bench.AddFiles(bench.Share("photo/many"), count, 100)) {
    many.push_back("/photo/many/" + name);
    bytes_of_paths += static_cast<double>(many.back().size());
  }
  for (const Strings& sources : {Strings{"/photo/endless"}, many}) {
    const std::string id = bench.Start(bench.RequestFor(sources, "zip", "best"));
    const pid_t worker = Workbench::Worker();
    // With its sources checked and listed, it starts the archiver.
    while (bench.Ask("status", id).code == 0 && !HasArchiver(worker)) {
      poll(nullptr, 0, 1);
    }
    const bool is_many = sources.size() > 1;
    const double limit = is_many ? 8 * bytes_of_paths : 3.0 * kMiB;
    std::ostringstream ours;
    std::ostringstream theirs;
    ours << std::lround(PrivateBytes(worker) / 1024) << " KiB";
    theirs << std::lround(limit / 1024) << " KiB allowed";
    PrintRow(is_many ? "memory of a worker with 100,000 sources" : "memory of a worker", ours.str(),
             theirs.str(), PrivateBytes(worker) / limit, "1");
    bench.Ask("stop", id);
    while (waitpid(-1, nullptr, 0) > 0) {  // the worker and its archiver
    }
  }
}

int Run(const fs::path& folder, const std::set<std::string>& wanted) {
  Workbench bench(folder);
  const std::map<std::string, std::function<void()>> rows = {
      {"1-tiny", [&] { TinyFile(bench); }},
      {"2-album", [&] { Album(bench); }},
      {"3-tree", [&] { Tree(bench); }},
      {"4-large", [&] { LargeFile(bench); }},
      {"5-shares", [&] { TwoShares(bench); }},
      {"6-many", [&] { ManySources(bench, folder); }},
      {"7-answers", [&] { Answers(bench, folder); }},
      {"9-memory", [&] { WorkerMemory(bench); }}};
  for (const auto& [name, run] : rows) {
    if (wanted.empty() || wanted.count(name) != 0) {
      run();
    }
  }
  return 0;
}

}  // namespace
}  // namespace Bench

int main(int argc, char** argv) {
  openlog("kavo-bench", LOG_PERROR, LOG_USER);
  try {
    Bench::Require(argc > 1, "usage: kavo-bench FOLDER [ROW]...");
    return Bench::Run(argv[1], {argv + 2, argv + argc});
  } catch (const std::exception& error) {
    std::cerr << "kavo-bench: " << error.what() << '\n';
    return 1;
  }
}
