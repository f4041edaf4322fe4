#include "device/host/launcher.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <ctime>
#include <optional>
#include <stdexcept>

#include "device/base/frame.h"
#include "device/base/json_text.h"
#include "device/model/device.h"
#include "device/platform/kavo/request_state.h"
#include "device/platform/lumo/errors.h"
#include "device/tasks/task_store.h"

namespace Device {

namespace {

std::string DlError() {
  const char* const reason = dlerror();
  return reason == nullptr ? "unknown reason" : reason;
}

void* LoadModule() {
  const std::string path = "/proc/self/fd/" + std::to_string(TheDevice().module.Get());
  void* const module = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (module == nullptr) {
    throw std::runtime_error("cannot load module: " + DlError());
  }
  return module;
}

const ApiRow* GetTable(void* module) {
  auto* const get_table = reinterpret_cast<void* (*)()>(dlsym(module, "GetAPITable"));
  if (get_table == nullptr) {
    throw std::runtime_error("cannot load module: " + DlError());
  }
  return static_cast<const ApiRow*>(get_table());
}

// False when the other side is gone.
bool SendOutcome(int fd, const Outcome& outcome) {
  Json::Value frame(Json::objectValue);
  frame["code"] = outcome.code;
  frame["data"] = outcome.data;
  return WriteFrame(fd, ToText(frame));
}

// False when the other side is gone without one.
bool ReceiveOutcome(int fd, Outcome& outcome) {
  const std::optional<std::string> text = ReadFrame(fd);
  if (text) {
    const Json::Value frame = ParseJson(*text);
    outcome = {frame["code"].asInt(), frame["data"]};
  }
  return text.has_value();
}

}  // namespace

Launcher::Launcher() : module_(LoadModule(), dlclose), table_(GetTable(module_.get())) {
  prctl(PR_SET_CHILD_SUBREAPER, 1);
}

const ApiRow* Launcher::FindRow(const Request& request, int& code) const {
  code = kErrNoApi;
  for (const ApiRow* row = table_; row->api != nullptr; ++row) {
    if (request.api != row->api) {
      continue;
    }
    if (request.method != row->method) {
      code = code == kErrNoApi ? kErrNoMethod : code;
      continue;
    }
    if (row->version == request.version) {
      return row;
    }
    code = kErrNoVersion;
  }
  return nullptr;
}

Outcome Launcher::CallHere(const Request& request) {
  Outcome outcome;
  const ApiRow* const row = FindRow(request, outcome.code);
  if (row == nullptr) {
    return outcome;
  }
  TheDevice().is_followed = request.is_followed;
  KAVO::APIRequest::State request_state{request};
  KAVO::APIResponse::State response_state;
  KAVO::APIRequest api_request{&request_state};
  KAVO::APIResponse api_response{&response_state};
  row->handler(&api_request, &api_response);
  return response_state.outcome;
}

Outcome Launcher::CallSafely(const Request& request) {
  try {
    return CallHere(request);
  } catch (const Json::Exception& error) {
    syslog(LOG_ERR, "%s: %s", request.method.c_str(), error.what());
    return {kErrBadParameter, Json::Value()};
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s: %s", request.method.c_str(), error.what());
    return {kErrInternal, Json::Value()};
  }
}

Outcome Launcher::Call(const Request& request) {
  Outcome outcome;
  if (FindRow(request, outcome.code) == nullptr) {
    return outcome;
  }
  int ends[2];
  if (pipe2(ends, O_CLOEXEC) != 0) {
    return {kErrInternal, Json::Value()};
  }
  const FileDescriptor read_end(ends[0]);
  FileDescriptor write_end(ends[1]);
  const pid_t pid = fork();
  if (pid < 0) {
    syslog(LOG_ERR, "cannot fork request process: %m");
    return {kErrInternal, Json::Value()};
  }
  if (pid == 0) {
    TheDevice().outcome = std::move(write_end);
    const Outcome reached = CallSafely(request);
    CloseStores();
    _exit(SendOutcome(TheDevice().outcome.Get(), reached) ? 0 : 1);
  }
  write_end.Close();
  if (!ReceiveOutcome(read_end.Get(), outcome)) {
    syslog(LOG_ERR, "request process %d ended without an outcome", static_cast<int>(pid));
    outcome = {kErrInternal, Json::Value()};
  }
  while (waitpid(pid, nullptr, 0) < 0 && errno == EINTR) {
  }
  return outcome;
}

bool Launcher::Reap() {
  bool has_reaped = false;
  while (waitpid(-1, nullptr, WNOHANG) > 0) {
    has_reaped = true;
  }
  return has_reaped;
}

void Launcher::AwaitWorker(std::chrono::milliseconds pause) {
  constexpr long kMilli = 1000;
  sigset_t child_ended;
  sigset_t saved;
  sigemptyset(&child_ended);
  sigaddset(&child_ended, SIGCHLD);
  // Held back, the signal of one that ends from now on is not missed.
  sigprocmask(SIG_BLOCK, &child_ended, &saved);
  if (!Reap()) {
    const timespec time = {static_cast<std::time_t>(pause.count() / kMilli),
                           static_cast<long>(pause.count() % kMilli) * kMilli * kMilli};
    sigtimedwait(&child_ended, nullptr, &time);
    Reap();
  }
  sigprocmask(SIG_SETMASK, &saved, nullptr);
}

std::chrono::milliseconds Launcher::PauseBeforeAsking(std::chrono::milliseconds pause,
                                                      std::chrono::milliseconds answer_time) {
  constexpr int kLeisure = 50;
  constexpr std::chrono::milliseconds kLongestLeisure(5000);
  return std::clamp(kLeisure * answer_time, pause, kLongestLeisure);
}

}  // namespace Device
