#include "tests/device_fixture.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <regex>

#include "device/base/json_text.h"
#include "device/host/sessions.h"
#include "device/platform/operations.h"
#include "tests/emulation.h"
#include "tests/libc_calls.h"

namespace fs = std::filesystem;

namespace {

constexpr char kConfig[] = R"({
  "volumes": ["vol1", "vol2"],
  "users": [
    { "name": "alice", "uid": 65001, "admin": true, "home": "vol1" },
    { "name": "bob", "uid": 65002, "home": "vol1", "codepage": "CP932" },
    { "name": "carol", "uid": 65003, "home": "vol1" }
  ],
  "shares": [
    { "name": "photo", "volume": "vol1",
      "access": { "alice": "rw", "bob": "rw", "carol": "list-denied" } },
    { "name": "music", "volume": "vol1", "access": { "alice": "rw", "bob": "ro" } },
    { "name": "vault", "volume": "vol2", "encrypted": true, "access": { "alice": "rw" } },
    { "name": "attic", "volume": "vol2", "read_only": true, "access": { "alice": "rw" } }
  ]
})";
constexpr uid_t kAliceUid = 65001;
const std::chrono::seconds kPatience(30 * kSlowness);

}  // namespace

std::string Built(const std::string& name) {
  return fs::read_symlink("/proc/self/exe").parent_path() / name;
}

std::string ModulePath() { return Built("KAVO.Zantro.Compress.so"); }

Strings ExpectedSequence(const std::string& name) {
  Strings lines = Lines(ReadFile(std::string(KAVO_TESTS_DIR) + "/sequences/" + name));
  EXPECT_FALSE(lines.empty()) << name;
  return lines;
}

Strings NamesOf(Strings sequence) {
  for (std::string& line : sequence) {
    line.resize(std::min(line.size(), line.find(' ')));
  }
  return sequence;
}

Strings UpTo(const Strings& names, const std::string& calls) {
  const std::string call = calls.substr(0, calls.find(" + "));
  const std::size_t hash = call.find('#');
  int left = hash == std::string::npos ? 1 : std::stoi(call.substr(hash + 1));
  for (auto at = names.begin(); at != names.end(); ++at) {
    if (*at == call.substr(0, hash) && --left == 0) {
      return Strings(names.begin(), at + 1) +
             Words(calls.substr(std::min(calls.size(), call.size() + 3)));
    }
  }
  ADD_FAILURE() << "no call " << call;
  return {};
}

Strings After(const Strings& names, const std::string& call) {
  return {std::find(names.rbegin(), names.rend(), call).base(), names.end()};
}

Strings operator+(Strings first, const Strings& second) {
  first.insert(first.end(), second.begin(), second.end());
  return first;
}

DeviceTest::DeviceTest() {
  umask(022);
  Device::Make(device_, kConfig);
  Device::Open(device_);
  SetLibcFiles(temp_.Path());
  chmod(temp_.Path().c_str(), 01777);  // the users' processes add files of their own
  StartOver();
  launcher_.emplace();
  const std::unique_ptr<void, int (*)(void*)> module(dlopen(ModulePath().c_str(), RTLD_NOW),
                                                     dlclose);
  WatchModule(module.get());
}

DeviceTest::~DeviceTest() {
  for (const TracedCall& fork : Calls("KLIBCProcFork")) {
    if (fork.result.asInt() > 0) {
      kill(-fork.result.asInt(), SIGKILL);  // what the test left running
      WaitUntil([&] { return Group(fork.result.asInt()).empty(); });
    }
  }
  while (waitpid(-1, nullptr, 0) > 0) {
  }
  Device::StopTracing();
  for (const std::string& path : StagedPaths()) {
    fs::remove_all(path);
  }
}

std::string DeviceTest::Add(const std::string& path, const std::string& text) {
  WriteFile(At(path), text);
  if (geteuid() == 0) {
    EXPECT_EQ(chown(At(path).c_str(), kAliceUid, Device::kUsersGroup), 0);
  }
  return At(path);
}

void DeviceTest::AddFaults(const Strings& rules) {
  std::for_each(rules.begin(), rules.end(), Device::AddFault);
}

Json::Value DeviceTest::JobParams(const Strings& sources, const std::string& dest,
                                  const std::string& options) {
  Json::Value params = Device::ParseJson(options);
  params["path"] = Device::ToText(Device::ToJson(sources));
  params["dest_file_path"] = Device::ToText(Device::ToJson(Strings{dest}));
  return params;
}

Device::Request DeviceTest::MakeRequest(const std::string& method, const Json::Value& params,
                                        const std::string& user) {
  Device::Request request;
  request.api = "KAVO.Zantro.Compress";
  request.method = method;
  request.version = 3;
  request.params = params;
  request.user = user;
  request.session_id = Device::SignIn(user);
  request.is_followed = true;
  return request;
}

Device::Outcome DeviceTest::Call(const std::string& method, const Json::Value& params,
                                 const std::string& user, int version) {
  Device::Request request = MakeRequest(method, params, user);
  request.version = version;
  return launcher_->Call(request);
}

Device::Outcome DeviceTest::Ask(const std::string& method, const std::string& task_id,
                                const std::string& user) {
  Json::Value params;
  params["taskid"] = task_id;
  return Call(method, params, user);
}

bool DeviceTest::WaitUntil(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) {
      return false;
    }
    poll(nullptr, 0, 2);
  }
  return true;
}

Json::Value DeviceTest::Follow(const std::string& task_id, const std::string& user) {
  Device::Outcome last;
  EXPECT_TRUE(WaitUntil([&] {
    last = Ask("status", task_id, user);
    return last.code != 0 || last.data["finished"].asBool();
  }));
  EXPECT_EQ(last.code, 0);
  return last.data;
}

Json::Value DeviceTest::RunJob(const Json::Value& params, const std::string& user) {
  const Device::Outcome started = Call("start", params, user);
  EXPECT_EQ(started.code, 0);
  Json::Value answer = Follow(started.data["taskid"].asString(), user);
  // The worker has said its last word in the log when it is gone.
  const int worker = Worker();
  EXPECT_TRUE(WaitUntil([&] {
    Device::Launcher::Reap();
    // Under an emulator the worker may be nobody's child here.
    return waitpid(-1, nullptr, WNOHANG) == -1 && Group(worker).empty();
  }));
  return answer;
}

Strings DeviceTest::FailJob(const Json::Value& params, const std::string& user) {
  const Json::Value answer = RunJob(params, user);
  EXPECT_TRUE(answer.isMember("errors")) << Device::ToText(answer);
  Strings items;
  for (const Json::Value& item : answer["errors"]) {
    items.push_back(item["path"].asString() + ": " + item["code"].asString());
  }
  return items;
}

Strings DeviceTest::Log() const {
  static const std::regex kPlace("(^|\n)(KAVO\\.Zantro\\.Compress|lumo_webapi):[0-9]+ ");
  static const std::regex kError("(errno: |set UGID, ).*");
  static const std::regex kNoFence("<4>the archiver is not fenced.*\n");
  const std::string log = std::regex_replace(ReadFile(temp_.Path() + "/log"), kNoFence, "");
  const std::string text = std::regex_replace(log, kPlace, "$1");
  return Lines(WithPlaceholders(std::regex_replace(text, kError, "$1*")));
}

std::vector<TracedCall> DeviceTest::Calls(const std::string& call) const {
  std::vector<TracedCall> calls;
  const std::string text = ReadFile(temp_.Path() + "/trace");
  // The last line may be in the middle of being written.
  for (const std::string& line : Lines(text.substr(0, text.rfind('\n') + 1))) {
    const Json::Value row = Device::ParseJson(line);
    if (call.empty() || row["call"] == call) {
      calls.push_back({row["pid"].asInt(), row["call"].asString(), row["args"], row["result"]});
    }
  }
  return calls;
}

std::set<pid_t> DeviceTest::Group(pid_t worker) {
  std::set<pid_t> processes;
  for (const fs::directory_entry& process : fs::directory_iterator("/proc")) {
    std::ifstream stat(process.path() / "stat");
    pid_t pid = 0;
    pid_t parent = 0;
    pid_t group = 0;
    std::string name;
    std::string state;
    if (stat >> pid >> name >> state >> parent >> group && group == worker && state != "Z") {
      processes.insert(pid);
    }
  }
  return processes;
}

int DeviceTest::Worker() const {
  int last = -1;
  for (const TracedCall& fork : Calls("KLIBCProcFork")) {
    last = fork.result.asInt() > 0 ? fork.result.asInt() : last;
  }
  return last;
}

Strings DeviceTest::Sequence(int pid, bool with_arguments) const {
  std::string text;
  for (const TracedCall& call : Calls()) {
    const bool is_getter = call.call.rfind("KAVO::APIRequest::", 0) == 0;
    if (call.pid == pid && !is_getter && call.call != "Vesk::Task::getTaskId") {
      const std::string arguments = Device::ToText(call.args);
      text += call.call + (call.args.empty() ? "" : " ");
      text += arguments.substr(1, arguments.size() - 2) + "\n";
    }
  }
  const Strings lines = Lines(WithPlaceholders(text));
  return with_arguments ? lines : NamesOf(lines);
}

std::string DeviceTest::WithPlaceholders(std::string text) const {
  const std::string worker =
      "(\"pid\":|\nDoKill |RemoveFinishedTask \"object\",)" + std::to_string(Worker()) + "\\b";
  text = std::regex_replace(text, std::regex(worker), "$1PID");
  static const std::regex kVarying(
      R"((Zantro_)[0-9A-Za-z_-]+|("started":)[0-9]+|(lumozip)[0-9A-Za-z]{6})");
  text = std::regex_replace(text, kVarying, "$1$2$3*");
  text = std::regex_replace(text, std::regex(device_), "DEV");
  static const std::regex kSession("\\b[0-9A-F]{32}\\b");
  text = std::regex_replace(text, kSession, "SID");
  return text;
}

void DeviceTest::StartOver() {
  Device::StopTracing();
  SetLibcFault({});
  for (const char* name : {"/log", "/trace"}) {
    std::ofstream(temp_.Path() + name, std::ios::trunc).flush();
  }
  Device::OpenTrace(temp_.Path() + "/trace");
}

void DeviceTest::ScriptArchiver(const std::string& text) {
  WriteFile(temp_.Path() + "/output", text);
  setenv("KAVO_SCRIPTED_OUTPUT", (temp_.Path() + "/output").c_str(), 1);
  Device::TheDevice().archiver =
      Device::FileDescriptor(open(Built("scripted-7z").c_str(), O_PATH | O_CLOEXEC));
}
