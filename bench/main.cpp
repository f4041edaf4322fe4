// kavo-bench [SWITCH]...: what requests and workers cost, measured by Google Benchmark, whose
// switches it takes. The working folder is a device with /photo/endless, which takes long to pack.
#include <benchmark/benchmark.h>
#include <sqlite3.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <optional>
#include <stdexcept>

#include "device/host/launcher.h"
#include "device/host/sessions.h"
#include "device/model/device.h"

namespace {

std::optional<Device::Launcher> launcher;
std::string session;
Json::Value task;  // of the job that runs

void Require(bool holds, const char* what) {
  if (!holds) {
    throw std::runtime_error(what);
  }
}

Device::Outcome Ask(const char* method, const Json::Value& params) {
  return launcher->Call({"KAVO.Zantro.Compress", method, 3, params, "alice", session, true});
}

void StartJob(const std::string& more_paths = "") {
  Json::Value params;
  params["path"] = "/photo/endless" + more_paths;
  params["dest_file_path"] = "/photo/ours";
  params["format"] = "7z";
  params["level"] = "best";
  task["taskid"] = Ask("start", params).data["taskid"];
  Require(!task["taskid"].asString().empty(), "the job does not start");
}

void LookAtJob() {
  const Device::Outcome outcome = Ask("status", task);
  Require(outcome.code == 0 && !outcome.data["finished"].asBool(), "the job does not last");
}

void StopJob() {
  Ask("stop", task);
  while (waitpid(-1, nullptr, 0) > 0) {  // the worker and its archiver
  }
}

// A process that does one thing with a database, and its end awaited.
void ForkAndRun(const char* sql) {
  const pid_t pid = fork();
  if (pid == 0) {
    sqlite3* connection = nullptr;
    // Like the device's own connections, it does not write its log back at its end.
    const bool is_done =
        sqlite3_open("least.db", &connection) == SQLITE_OK &&
        sqlite3_db_config(connection, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr) == SQLITE_OK &&
        sqlite3_exec(connection, sql, nullptr, nullptr, nullptr) == SQLITE_OK;
    sqlite3_close(connection);
    _exit(is_done ? 0 : 1);
  }
  int status = 0;
  Require(waitpid(pid, &status, 0) == pid && status == 0, "database");
}

void Start() { StartJob(); }

void Insert() {
  ForkAndRun("PRAGMA synchronous = NORMAL; INSERT INTO rows (value) VALUES ('value');");
}

void Select() { ForkAndRun("SELECT value FROM rows WHERE id = 1;"); }

void None() {}

void Answer(benchmark::State& state, void (*before)(), void (*request)(), void (*after)()) {
  before();
  for (auto _ : state) {  // NOLINT(clang-analyzer-deadcode.DeadStores)
    request();
  }
  after();
}
BENCHMARK_CAPTURE(Answer, start_ours, None, Start, StopJob)->Iterations(1);
BENCHMARK_CAPTURE(Answer, start_theirs, None, Insert, None)->Iterations(1);
BENCHMARK_CAPTURE(Answer, status_ours, Start, LookAtJob, StopJob)->Iterations(20);
BENCHMARK_CAPTURE(Answer, status_theirs, Start, Select, StopJob)->Iterations(20);

pid_t ChildOf(pid_t parent) {
  const std::string id = std::to_string(parent);
  pid_t child = 0;
  std::ifstream("/proc/" + id + "/task/" + id + "/children") >> child;
  return child;
}

// The worker's memory that no other process shares, once its archiver has begun: alone with the
// endless file, or with all in /photo/many besides.
void Memory(benchmark::State& state, bool is_of_many) {
  std::string more_paths;
  for (const auto& file : std::filesystem::directory_iterator("vol1/photo/many")) {
    more_paths += is_of_many ? ",/photo/many/" + file.path().filename().string() : "";
  }
  for (auto _ : state) {  // NOLINT(clang-analyzer-deadcode.DeadStores)
    StartJob(more_paths);
    const pid_t worker = ChildOf(getpid());
    while (ChildOf(ChildOf(worker)) == 0) {
      LookAtJob();
    }
    std::ifstream maps("/proc/" + std::to_string(worker) + "/smaps_rollup");
    for (std::string line; std::getline(maps, line);) {
      state.counters["KiB"] +=
          line.rfind("Private_", 0) == 0 ? std::stod(line.substr(line.find(':') + 1)) : 0;
    }
    StopJob();
  }
  Require(state.counters["KiB"] > 0, "no memory");
}
BENCHMARK_CAPTURE(Memory, one, false)->Iterations(1);
BENCHMARK_CAPTURE(Memory, many, true)->Iterations(1);

}  // namespace

int main(int argc, char** argv) {
  openlog("kavo-bench", LOG_PERROR, LOG_USER);
  benchmark::Initialize(&argc, argv);
  try {
    Device::Open(".");
    launcher.emplace();
    session = Device::SignIn("alice");
    ForkAndRun(
        "CREATE TABLE IF NOT EXISTS rows (id INTEGER PRIMARY KEY, value);"
        "PRAGMA journal_mode = WAL; INSERT OR IGNORE INTO rows VALUES (1, 'value');");
    benchmark::RunSpecifiedBenchmarks();
    return 0;
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s", error.what());
    if (launcher) {
      StopJob();
    }
    return 1;
  }
}
