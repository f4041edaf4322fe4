// The module's methods, linked into this program, on a device in a temporary folder; nothing forks.
// An input is lines NAME=TEXT and NAME:=JSON: the request's parameters, and among them `version`,
// `faults` (a bit for each of kRules), and what the task Zantro_1 holds: `data`, `progress`,
// `finished`.
#include <syslog.h>

#include <climits>
#include <set>

#include "device/base/json_text.h"
#include "device/model/device.h"
#include "device/platform/kavo/request.h"
#include "device/platform/operations.h"
#include "device/tasks/user_tasks.h"
#include "platform/kavo/api_table.h"
#include "tests/fuzz/targets.h"

extern "C" void* GetAPITable();

namespace {

constexpr char kTask[] = "Zantro_1";
constexpr const char* kRules[] = {
    "KLIBCProcFork=-1",         "Vesk::TaskMgr::getTaskWithThrow=throw",
    "Vesk::Task::endUpdate=0",  "Vesk::TaskMgr::getUniqueTaskId=throw",
    "Vesk::Task::Task=throw",   "KavoSettings::loadUserJsonSettings=0",
    "LumoLibUGIDSet=-1:402",    "DoKill=0",
    "Vesk::Task::setProperty=0"};
constexpr unsigned kNoFork = 1;
constexpr unsigned kNoTask = 2;
constexpr unsigned kNoData = 256;

struct FuzzDevice {
  FuzzDevice() {
    setlogmask(LOG_MASK(LOG_EMERG));
    Device::Make(path, R"({"volumes": ["vol1"], "shares": [],
                           "users": [{"name": "alice", "uid": 65001, "home": "vol1"}]})");
    Device::Open(path);
  }
  const TempFolder temp;
  const std::string path = temp.Path() + "/device";
};

Device::TaskStore& Store() {
  static const FuzzDevice device;
  return Device::StoreOf("alice");
}

Json::Value ReadScene(const std::string& input) {
  Json::Value scene(Json::objectValue);
  for (const std::string& line : SplitAt('\n', input)) {
    const std::size_t colon = line.find(":=");
    const std::size_t equals = line.find('=');
    if (colon != std::string::npos) {
      try {
        scene[line.substr(0, colon)] =
            Device::ParseJson(line.substr(colon + 2), Device::kParamDepth);
      } catch (const std::runtime_error&) {  // no JSON: not there
      }
    } else if (equals != std::string::npos) {
      scene[line.substr(0, equals)] = line.substr(equals + 1);
    }
  }
  return scene;
}

unsigned Faults(const Json::Value& scene) {
  return scene["faults"].isUInt() ? scene["faults"].asUInt() : 0;
}

// INT_MIN as the code when an exception for the host left the module.
Device::Outcome Serve(const Json::Value& scene, const std::string& method,
                      const std::set<int>& codes) {
  Device::StopTracing();
  for (std::size_t rule = 0; rule < std::size(kRules); ++rule) {
    if ((Faults(scene) >> rule & 1U) != 0) {
      Device::AddFault(kRules[rule]);
    }
  }
  const Json::Value& data = scene["data"];
  if (!data.isObject() || !data.isMember("pid")) {
    Device::AddFault("WaitForTaskDataKeyReady=0");  // without the minute's wait
  }
  for (const char* rule : {"LumoLibUGIDSet=0", "KLIBCProcFork=2147483647", "DoKill=1",
                           "KAVO::APIResponse::SetError#2=throw"}) {
    Device::AddFault(rule);
  }
  const Json::Value& version = scene["version"];
  Device::Request request;
  request.method = method;
  request.version = version == 1 || version == 2 ? version.asInt() : 3;
  request.params = scene;
  request.user = "alice";
  KAVO::APIRequest::State request_state{request};
  KAVO::APIResponse::State state{{INT_MIN, {}}};
  KAVO::APIRequest api_request{&request_state};
  KAVO::APIResponse api_response{&state};
  bool threw = false;
  try {
    static_cast<const KAVO::ApiRow*>(GetAPITable())->handler(&api_request, &api_response);
  } catch (const Json::Exception&) {
    threw = true;
  }
  Require(threw == (state.outcome.code == INT_MIN), "a request has one outcome or throws");
  Require(threw || codes.count(state.outcome.code) != 0, "the code is one of the method's");
  return state.outcome;
}

void PutTask(const Json::Value& scene) {
  Device::TaskRow row;
  row.id = kTask;
  for (const char* name : {"data", "progress"}) {
    if (!scene[name].isNull()) {
      row.properties[name] = scene[name];
    }
  }
  Store().RemoveTask(kTask);
  Store().AddTask(row);
  Store().UpdateTask(row, {}, scene["finished"] == true);
}

}  // namespace

void FuzzStartRequest(const std::string& input) {
  const Json::Value scene = ReadScene(input);
  Store();
  const Device::Outcome outcome = Serve(scene, "start", {0, 101, 401, 402, 1300, 1301});
  const std::vector<Device::TaskRow> tasks = Device::AllTasks("alice");
  for (const Device::TaskRow& task : tasks) {
    Store().RemoveTask(task.id);
  }
  const bool has_task =
      outcome.code == 0 || (outcome.code == 1300 && (Faults(scene) & kNoFork) == 0);
  Require(tasks.size() == (has_task ? 1U : 0U), "a job that has begun has a task, and no other");
  if (outcome.code != 0 || (Faults(scene) & kNoData) != 0) {
    return;
  }
  Require(outcome.data["taskid"] == tasks[0].id, "the answer names the task");
  const Json::Value params = tasks[0].properties.at("data").Member("params");
  Require(!params["path"].empty() && !params["path"][0].asString().empty(), "there is a source");
  Require(!params["dest_file_path"].asString().empty(), "there is a destination");
  Require(Device::ToText(params["password"]) == Device::ToText(scene["password"]),
          "a password is stored as it was given");
}

void FuzzTaskRequest(const std::string& input) {
  const Json::Value scene = ReadScene(input);
  PutTask(scene);
  const Json::Value answer = Serve(scene, "status", {0, 101, 401, 402, 599}).data;
  Require(!answer["finished"].asBool() || !Store().FindTask(kTask), "an end is reported once");
  PutTask(scene);
  const int code = Serve(scene, "stop", {0, 101, 401, 402}).code;
  const Json::Value& id = scene["taskid"];
  const bool is_meant = id.isString() && std::string(id.asCString()) == kTask;
  const bool is_found = code == 0 || code == 401 || code == INT_MIN;
  const bool is_stopped = is_meant && is_found && (Faults(scene) & kNoTask) == 0;
  Require(!Store().FindTask(kTask) == is_stopped, "what is stopped is removed, and nothing else");
}
