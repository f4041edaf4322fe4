#include "device/host/launcher.h"

#include <dlfcn.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <stdexcept>
#include <system_error>

#include "device/base/child_process.h"
#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/base/open_below.h"
#include "device/base/shortage.h"
#include "device/host/sessions.h"
#include "device/model/device.h"
#include "device/platform/host_services.h"
#include "device/platform/kavo/request.h"
#include "device/platform/lumo/identity.h"
#include "device/tasks/leftovers.h"
#include "device/tasks/task_store.h"
#include "platform/kavo/error_codes.h"

namespace Device {

namespace {

constexpr char kCannotLoad[] = "cannot load module: ";

void* LoadModule() {
  const std::string path = PathOf(TheDevice().module.Get());
  void* const module = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (module == nullptr) {
    throw std::runtime_error(std::string(kCannotLoad) + dlerror());
  }
  return module;
}

const KAVO::ApiRow* GetTable(void* module) {
  auto* const get_table = reinterpret_cast<void* (*)()>(dlsym(module, "GetAPITable"));
  if (get_table == nullptr) {
    throw std::runtime_error(std::string(kCannotLoad) + dlerror());
  }
  return static_cast<const KAVO::ApiRow*>(get_table());
}

// Null, and the host's error code in `code`, when no row serves the request.
const KAVO::ApiRow* FindRow(const KAVO::ApiRow* row, const Request& request, int& code) {
  code = KAVO::kErrNoApi;
  for (; row->api != nullptr; ++row) {
    if (request.api == row->api) {
      const bool is_method = request.method == row->method;
      if (is_method && request.version == row->version) {
        return row;
      }
      // The one that comes nearest is told: the codes ascend.
      code = std::max<int>(code, is_method ? KAVO::kErrNoVersion : KAVO::kErrNoMethod);
    }
  }
  return nullptr;
}

// True if somebody may read standard error until every process has closed it.
bool IsStandardErrorRead() {
  struct stat status {};
  return fstat(STDERR_FILENO, &status) == 0 &&
         (S_ISFIFO(status.st_mode) || S_ISSOCK(status.st_mode));
}

}  // namespace

Launcher::Launcher(WorkerLog worker_log)
    : module_(LoadModule(), dlclose), table_(GetTable(module_.get())) {
  prctl(PR_SET_CHILD_SUBREAPER, 1);
  TheHost().has_session = [](const std::string& id, const std::string& user) {
    return UserOfSession(id) == user;
  };
  TheHost().leave_request = [this, worker_log] {
    answer_.Close();
    KeepSessions();
    LiftMemoryLimit();
    Database::SetPatience(Database::kLongPatience);
    if (worker_log == WorkerLog::kSyslogOnly && IsStandardErrorRead()) {
      dup2(STDOUT_FILENO, STDERR_FILENO);  // /dev/null
    }
  };
}

Launcher::~Launcher() { TheHost() = {}; }

Outcome Launcher::CallHere(const Request& request) {
  Outcome outcome;
  const KAVO::ApiRow* const row = FindRow(table_, request, outcome.code);
  if (row == nullptr) {
    return outcome;
  }
  TheHost().notifies_desktop = !request.is_followed;
  KAVO::APIRequest::State request_state{request};
  KAVO::APIResponse::State response_state;
  KAVO::APIRequest api_request{&request_state};
  KAVO::APIResponse api_response{&response_state};
  row->handler(&api_request, &api_response);
  char none = 0;
  ReadAll(TheHost().worker_entered.Get(), &none, 1);
  return response_state.outcome;
}

Outcome Launcher::CallSafely(const Request& request) {
  try {
    return CallHere(request);
  } catch (const Json::RuntimeError& error) {  // the library has no memory
    TheShortage() = Shortage::kMemory;
    return {KAVO::kErrInternal, Json::Value()};
  } catch (const Json::Exception& error) {
    syslog(LOG_ERR, "%s: %s", request.method.c_str(), error.what());
    return {KAVO::kErrBadParameter, Json::Value()};
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s: %s", request.method.c_str(), error.what());
    return {KAVO::kErrInternal, Json::Value()};
  } catch (...) {
    syslog(LOG_ERR, "%s: unexpected failure", request.method.c_str());
    return {KAVO::kErrInternal, Json::Value()};
  }
}

Outcome Launcher::Call(const Request& request) {
  Outcome outcome{KAVO::kErrInternal, Json::Value()};
  try {
    const std::optional<Json::Value> reached = AskProcess(answer_, [&] {
      const Outcome own = CallSafely(request);
      return JsonObject({{"code", own.code}, {"data", own.data}});
    });
    if (reached) {
      outcome = {(*reached)["code"].asInt(), (*reached)["data"]};
    }
  } catch (const std::system_error& error) {
    syslog(LOG_ERR, "cannot start request process: %s", error.what());
  }
  return outcome;
}

std::optional<Json::Value> AskProcess(FileDescriptor& stream,
                                      const std::function<Json::Value()>& body) {
  Pipe pipe;
  ChildProcess process = ChildProcess::Run([&] {
    stream = std::move(pipe.writer);
    const Json::Value answer = body();
    CloseStores();
    return WriteFrame(stream.Get(), ToText(answer)) ? 0 : 1;
  });
  pipe.writer.Close();
  const std::optional<std::string> text = ReadFrame(pipe.reader.Get());
  if (!text) {
    syslog(LOG_ERR, "request process %d ended without an outcome", process.Pid());
  }
  process.Wait();
  return text ? std::optional(ParseJson(*text)) : std::nullopt;
}

void Launcher::Reap() {
  while (waitpid(-1, nullptr, WNOHANG) > 0) {
  }
}

void RemoveLeftoversOfAll() {
  for (const User& user : TheDevice().config.users) {
    ChildProcess::Run([&] {
      if (SwitchTo(nullptr, user.name.c_str()) == 0) {
        RemoveOldLists();
        RemoveLeftovers(user.name);
      }
      return 0;
    }).Release();  // a user can hold a process of the user's up
  }
}

}  // namespace Device
