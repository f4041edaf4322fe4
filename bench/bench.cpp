#include "bench/bench.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <fstream>
#include <memory>

#include "device/base/json_text.h"
#include "device/host/sessions.h"
#include "device/model/device.h"

namespace Bench {

namespace {

constexpr char kConfig[] = R"({"volumes": ["vol1"],
  "users": [{"name": "alice", "uid": 65001, "home": "vol1"}],
  "shares": [{"name": "photo", "volume": "vol1", "access": {"alice": "rw"}},
             {"name": "music", "volume": "vol1", "access": {"alice": "rw"}}]})";
constexpr uid_t kUid = 65001;

void GiveToUser(const fs::path& path) {
  Require(geteuid() != 0 || chown(path.c_str(), kUid, Device::kUsersGroup) == 0, "chown");
}

}  // namespace

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

void Workbench::RemoveArchive() const { fs::remove(Share("photo") / "out"); }

Device::Request Workbench::RequestFor(const Strings& sources, const std::string& format,
                                      const std::string& level) const {
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

pid_t Workbench::Worker() {
  const std::string id = std::to_string(getpid());
  std::ifstream children("/proc/" + id + "/task/" + id + "/children");
  pid_t worker = -1;
  Require(static_cast<bool>(children >> worker), "no worker");
  return worker;
}

Side Workbench::Job(const Strings& sources, const std::string& format, const std::string& level) {
  const Device::Request request = RequestFor(sources, format, level);
  struct Task {
    std::string id;
    bool is_finished = false;  // said once, when the task is no more
  };
  const auto task = std::make_shared<Task>();
  const auto ask = [this, task] {
    if (task->is_finished) {
      return;
    }
    const Device::Outcome outcome = Ask("status", task->id);
    Require(outcome.code == 0 && !outcome.data.isMember("errors"), Device::ToText(outcome.data));
    task->is_finished = outcome.data["finished"].asBool();
  };
  return {[this] { RemoveArchive(); },
          [this, task, request] {
            *task = Task{Start(request)};
            return Worker();
          },
          [ask] {
            // As a client does, "kavo-device compress" for one.
            const double seconds = Seconds(ask);
            return Device::Launcher::PauseBeforeAsking(
                std::chrono::seconds(1), std::chrono::milliseconds(std::lround(1000 * seconds)));
          },
          [ask, task](int /*status*/) {
            ask();
            Require(task->is_finished, "the worker has ended before its task");
          }};
}

Side Workbench::Bare(const fs::path& folder, const Strings& names, Strings switches,
                     const std::string& name) const {
  const fs::path list = folder_ / (name + ".list");
  const fs::path archive = folder_ / (name + ".out");  // 7z adds an ending where there is none
  switches.insert(switches.begin(), {"/usr/bin/7z", "a", "-spd", "-bso0", "-bsp0"});
  switches.insert(switches.end(), {archive.string(), "@" + list.string()});
  return {[=] {
            std::ofstream text(list);
            for (const std::string& each : names) {
              text << each << '\n';
            }
            fs::remove(archive);
          },
          [=] {
            std::vector<char*> arguments;
            for (const std::string& each : switches) {
              arguments.push_back(const_cast<char*>(each.c_str()));
            }
            arguments.push_back(nullptr);
            const pid_t pid = fork();
            if (pid == 0) {
              setpgid(0, 0);
              Require(chdir(folder.c_str()) == 0, "chdir");
              execv(arguments[0], arguments.data());
              _exit(1);
            }
            Require(pid > 0, "fork");
            setpgid(pid, pid);
            return pid;
          },
          nullptr, [](int status) { Require(status == 0, "7z failed"); }};
}

}  // namespace Bench
