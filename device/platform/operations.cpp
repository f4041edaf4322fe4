#include "device/platform/operations.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <map>
#include <stdexcept>

#include "device/base/file_descriptor.h"
#include "device/base/json_text.h"
#include "device/platform/lumo/errors.h"

namespace Device {

namespace {

// clang-format off
constexpr const char* kOperations[] = {
    "KAVO::APIRequest::HasParam", "KAVO::APIRequest::GetParam", "KAVO::APIRequest::GetAPIVersion",
    "KAVO::APIRequest::GetAPIClass", "KAVO::APIRequest::GetAPIMethod",
    "KAVO::APIRequest::GetLoginUserName", "KAVO::APIRequest::GetSessionID",
    "KAVO::APIResponse::SetError", "KavoSettings::KavoSettings",
    "KavoSettings::loadUserJsonSettings", "Vesk::TaskMgr::TaskMgr",
    "Vesk::TaskMgr::getUniqueTaskId", "Vesk::TaskMgr::getTaskWithThrow", "Vesk::Task::Task",
    "Vesk::Task::getTaskId", "Vesk::Task::beginUpdate", "Vesk::Task::endUpdate",
    "Vesk::Task::setProperty", "Vesk::Task::getProperty", "Vesk::Task::getBoolProperty",
    "Vesk::Task::getDoubleProperty", "Vesk::Task::reload", "Vesk::Task::finish",
    "Vesk::Task::isFinished", "Vesk::Task::remove", "Vesk::Task::sendNotifyMessageNoEncode",
    "SaveTaskData", "WaitForTaskDataReady", "WaitForTaskDataKeyReady", "LumoLibBkgTaskInfoCreate",
    "LumoLibRemoveFinishedTask", "CleanTimeOutTasks", "DoKill", "LumoLibGetErr",
    "LumoParseErrnoToError", "LumoParseErrorToVeskString", "LumoLibUGIDSet", "LumoLibUmask",
    "LumoLibRestoreUmask", "LumoLibGetUmask", "PathInfoFactory::create", "LumoFullPathGet",
    "IsDirUserHome", "LumoCheckPath", "LumoCheckFileName", "FindCommonParent", "VolumePathParse",
    "LumoLibGetPrivilege", "CheckShareListPrivilege", "ACLAccess", "LumoLibCheckEncryptShare",
    "LumoLibChown2Admin", "StringExplodeEx", "WebUtils::EncodeHtml", "KLIBCErrGet",
    "KLIBCErrorGetFile", "KLIBCErrorGetLine", "KLIBCProcFork", "KLIBCPopenv", "KLIBCPclose",
    "KLIBCExecl", "KLIBCEncShParam", "KLIBGroupIsAdminGroupMem", "KLIBKavoIndexAdd",
    "KAVOFSAclChmod"
};
// clang-format on
FileDescriptor& TraceFile() {
  static FileDescriptor file;
  return file;
}

std::vector<Fault>& Faults() {
  static std::vector<Fault> faults;
  return faults;
}

// How often each operation was called in this process and before it was forked.
std::map<std::string, std::uint64_t>& Counts() {
  static std::map<std::string, std::uint64_t> counts;
  return counts;
}

[[noreturn]] void RefuseRule(const std::string& rule, const std::string& reason) {
  throw std::invalid_argument("fault rule '" + rule + "': " + reason);
}

// Takes the code off a result that ends in ":" and a number.
void SplitCode(Fault& fault) {
  const std::size_t colon = fault.result.rfind(':');
  if (colon == std::string::npos || colon + 1 == fault.result.size() ||
      fault.result.find_first_not_of("-0123456789", colon + 1) != std::string::npos) {
    return;
  }
  fault.has_code = true;
  fault.code = std::stoi(fault.result.substr(colon + 1));
  fault.result.resize(colon);
}

// Takes the outputs out of a result that is an object with a "result" of its own.
void SplitOutputs(Fault& fault) {
  Json::Value object;
  try {
    object = ParseJson(fault.result);
  } catch (const std::runtime_error&) {
    return;  // a plain text
  }
  if (object.isObject() && object.isMember("result")) {
    fault.result = object["result"].asString();
    fault.outputs = object;
  }
}

}  // namespace

void OpenTrace(const std::string& path) {
  constexpr mode_t kTraceMode = 0600;  // arguments may hold passwords
  FileDescriptor file(open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, kTraceMode));
  if (!file) {
    ThrowErrno("cannot open trace file '" + path + "'");
  }
  TraceFile() = std::move(file);
}

void AddFault(const std::string& rule) {
  const std::size_t equals = rule.find('=');
  if (equals == std::string::npos) {
    RefuseRule(rule, "expected CALL[#N]=RESULT[:CODE]");
  }
  Fault fault;
  fault.call = rule.substr(0, equals);
  fault.result = rule.substr(equals + 1);
  const std::size_t hash = fault.call.find('#');
  try {
    if (hash != std::string::npos) {
      fault.number = std::stoull(fault.call.substr(hash + 1));
      fault.call.resize(hash);
    }
    SplitCode(fault);
  } catch (const std::logic_error&) {
    RefuseRule(rule, "N and CODE are numbers");
  }
  SplitOutputs(fault);
  if (std::find(std::begin(kOperations), std::end(kOperations), fault.call) ==
      std::end(kOperations)) {
    RefuseRule(rule, "no operation '" + fault.call + "'");
  }
  Faults().push_back(fault);
}

std::vector<std::string> OperationNames() {
  return {std::begin(kOperations), std::end(kOperations)};
}

void StopTracing() {
  TraceFile().Close();
  Faults().clear();
  Counts().clear();
}

Json::Value ToJson(const char* text) { return text == nullptr ? Json::Value() : Json::Value(text); }

Json::Value ToJson(const std::vector<std::string>& texts) { return JsonArray(texts); }

Json::Value ToJson(char* const* argument_vector) {
  Json::Value array(Json::arrayValue);
  for (; *argument_vector != nullptr; ++argument_vector) {
    array.append(*argument_vector);
  }
  return array;
}

bool Operation::IsTracedOrFaulty() { return TraceFile() || !Faults().empty(); }

const Fault* Operation::CountAndMatch(const char* name) {
  const std::uint64_t number = ++Counts()[name];
  for (const Fault& fault : Faults()) {
    if (fault.call == name && (fault.number == 0 || fault.number == number)) {
      return &fault;
    }
  }
  return nullptr;
}

void Operation::ApplyFault() {
  if (fault_->has_code) {
    SetLastError(fault_->code);
  }
  if (fault_->result == "crash") {
    raise(SIGKILL);
  }
  const bool is_int = fault_->result == "throw-int";
  if (is_int || fault_->result == "throw") {
    Trace(Json::Value("throws"));
    if (is_int) {
      throw fault_->code;
    }
    throw std::runtime_error("fault rule");
  }
}

void Operation::Trace(const Json::Value& result) const {
  if (!TraceFile()) {
    return;
  }
  const int saved_errno = errno;
  const std::string text =
      ToText(JsonObject({{"pid", getpid()},
                         {"call", name_},
                         {"args", arguments_.isNull() ? Json::arrayValue : arguments_},
                         {"result", result}})) +
      "\n";
  // One write per line, so that processes do not mix theirs. A trace that cannot be written is
  // lost.
  if (write(TraceFile().Get(), text.data(), text.size()) < 0) {
    TraceFile().Close();
  }
  errno = saved_errno;
}

}  // namespace Device
