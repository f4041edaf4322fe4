#include "bench/bench.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <fstream>
#include <stdexcept>

#include "device/bodies/device.h"
#include "device/bodies/json_text.h"
#include "device/host/sessions.h"

namespace Bench {

namespace {

constexpr char kConfig[] = R"({"volumes": ["vol1"],
  "users": [{"name": "alice", "uid": 65001, "home": "vol1"}],
  "shares": [{"name": "photo", "volume": "vol1", "access": {"alice": "rw"}},
             {"name": "music", "volume": "vol1", "access": {"alice": "rw"}}]})";
constexpr uid_t kUid = 65001;

constexpr double kHalf = 0.5;
constexpr double kQuarter = 0.25;

double Quantile(std::vector<double> values, double part) {
  std::sort(values.begin(), values.end());
  return values[static_cast<std::size_t>(part * static_cast<double>(values.size()))];
}

Range MiddleHalf(const std::vector<double>& values) {
  return {Quantile(values, kQuarter), Quantile(values, 1 - kQuarter)};
}

void GiveToUser(const fs::path& path) {
  Require(geteuid() != 0 || chown(path.c_str(), kUid, Device::kUsersGroup) == 0, "chown");
}

}  // namespace

double Seconds(const std::function<void()>& body) {
  const auto begin = std::chrono::steady_clock::now();
  body();
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count();
}

Medians Compare(const std::function<double()>& ours, const std::function<double()>& theirs,
                std::size_t pairs) {
  ours();
  double before = theirs();
  std::vector<double> all_ours;
  std::vector<double> all_theirs;
  std::vector<double> ratios;
  std::vector<double> repeats;
  for (std::size_t pair = 0; pair < pairs; ++pair) {
    all_ours.push_back(ours());
    all_theirs.push_back(theirs());
    const double after = all_theirs.back();
    ratios.push_back(all_ours.back() / (kHalf * (before + after)));
    repeats.push_back(after / before);
    before = after;
  }
  return {Quantile(all_ours, kHalf), Quantile(all_theirs, kHalf), Quantile(ratios, kHalf),
          MiddleHalf(ratios), MiddleHalf(repeats)};
}

void Require(bool holds, const std::string& what) {
  if (!holds) {
    throw std::runtime_error(what);
  }
}

Workbench::Workbench(const fs::path& folder) : folder_(fs::absolute(folder)) {
  fs::remove_all(folder_);
  Device::Make(folder_ / "device", kConfig);
  Device::Open(folder_ / "device");
  launcher_.emplace();
  session_ = Device::SignIn("alice");
}

Strings Workbench::AddFiles(const fs::path& folder, std::size_t count, std::size_t size,
                            bool is_sparse) {
  const bool is_new = fs::create_directories(folder);
  Strings names;
  std::vector<std::uint64_t> noise(is_sparse ? 0 : size / sizeof(std::uint64_t) + 1);
  for (std::size_t index = 0; index < count; ++index) {
    names.push_back("file-number-" + std::to_string(index) + ".dat");
    const fs::path file = folder / names.back();
    if (!is_new && fs::exists(file)) {
      continue;
    }
    std::generate(noise.begin(), noise.end(), std::ref(random_));
    std::ofstream(file, std::ios::binary)
        .write(reinterpret_cast<const char*>(noise.data()),
               static_cast<std::streamsize>(is_sparse ? 0 : size));
    fs::resize_file(file, size);
    GiveToUser(file);
  }
  GiveToUser(folder);
  return names;
}

Device::Request Workbench::Prepare(const Strings& sources, const std::string& format,
                                   const std::string& level) const {
  fs::remove(Share("photo") / "out");
  Json::Value list(Json::arrayValue);
  for (const std::string& source : sources) {
    list.append(source);
  }
  Device::Request request;
  request.params["path"] = Device::ToText(list);
  request.params["dest_file_path"] = R"(["/photo/out"])";
  request.params["format"] = format;
  request.params["level"] = level;
  request.api = "KAVO.Zantro.Compress";
  request.method = "start";
  request.version = 3;
  request.user = "alice";
  request.session_id = session_;
  request.is_followed = true;
  return request;
}

std::string Workbench::Start(const Device::Request& request) {
  const Device::Outcome outcome = launcher_->Call(request);
  Require(outcome.code == 0, "start: " + std::to_string(outcome.code));
  return outcome.data["taskid"].asString();
}

Device::Outcome Workbench::Ask(const std::string& method, const std::string& task_id) {
  Device::Request request;
  request.params["taskid"] = task_id;
  request.api = "KAVO.Zantro.Compress";
  request.method = method;
  request.version = 3;
  request.user = "alice";
  request.session_id = session_;
  return launcher_->Call(request);
}

void Workbench::Finish(const std::string& task_id) {
  // Of a client that asks from time to time, as "kavo-device compress" does.
  constexpr std::chrono::milliseconds kPause(1000);
  Device::Outcome outcome;
  std::chrono::milliseconds took(0);
  while (!outcome.data["finished"].asBool()) {
    Device::Launcher::AwaitWorker(kPause, took);
    const double seconds = Seconds([&] { outcome = Ask("status", task_id); });
    took = std::chrono::milliseconds(std::lround(1000 * seconds));
    Require(outcome.code == 0 && !outcome.data.isMember("errors"), Device::ToText(outcome.data));
  }
}

double Workbench::Job(const Strings& sources, const std::string& format, const std::string& level) {
  const Device::Request request = Prepare(sources, format, level);
  sync();  // what the run before has written is not written back during this one
  return Seconds([&] { Finish(Start(request)); });
}

double Workbench::Bare(const fs::path& folder, const Strings& names, Strings switches) {
  const fs::path list = folder_ / "list";
  const fs::path archive = folder_ / "bare.out";  // 7z adds an ending where there is none
  std::ofstream text(list);
  for (const std::string& name : names) {
    text << name << '\n';
  }
  text.close();
  fs::remove(archive);
  switches.insert(switches.begin(), {"/usr/bin/7z", "a", "-spd", "-bso0", "-bsp0"});
  switches.insert(switches.end(), {archive.string(), "@" + list.string()});
  std::vector<char*> arguments;
  for (std::string& each : switches) {
    arguments.push_back(each.data());
  }
  arguments.push_back(nullptr);
  sync();
  return Seconds([&] {
    const pid_t pid = fork();
    if (pid == 0) {
      Require(chdir(folder.c_str()) == 0, "chdir");
      execv(arguments[0], arguments.data());
      _exit(1);
    }
    int status = 0;
    Require(waitpid(pid, &status, 0) == pid && status == 0, "7z failed");
  });
}

}  // namespace Bench
