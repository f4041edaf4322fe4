#include "device/host/web_host.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <syslog.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <stdexcept>

#include "device/base/json_text.h"
#include "device/host/http_status.h"
#include "device/host/web_request.h"
#include "device/model/device.h"
#include "device/tasks/task_store.h"
#include "device/tasks/task_view.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

constexpr char kFrontEndProgram[] = "kavo-web";
constexpr char kPageFolder[] = "page";
constexpr char kLockFile[] = "serve.lock";
constexpr std::size_t kMostRequests = 384;  // at the same time; further ones wait
constexpr int kRestartPauseMs = 500;
constexpr std::chrono::seconds kFrontEndGrace(6);

FileDescriptor OpenBeside(const char* name) {
  const std::string path =
      (std::filesystem::read_symlink("/proc/self/exe").parent_path() / name).string();
  FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) {
    throw std::runtime_error(path + ": " + std::strerror(errno));
  }
  return file;
}

// A lock that belongs to this process alone: no worker takes it along.
FileDescriptor LockDevice() {
  constexpr mode_t kMode = 0600;
  const std::string path = TheDevice().root + "/" + kLockFile;
  FileDescriptor file(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, kMode));
  struct flock lock {};
  lock.l_type = F_WRLCK;
  if (!file || fcntl(file.Get(), F_SETLK, &lock) != 0) {
    const bool is_taken = errno == EACCES || errno == EAGAIN;
    throw std::runtime_error("device '" + TheDevice().root + "': " +
                             (is_taken ? "another process serves it" : std::strerror(errno)));
  }
  return file;
}

// What the front end's process becomes; one that cannot start says so.
[[noreturn]] void BecomeFrontEnd(const FrontEndFiles& files, int control,
                                 const std::string& listen) {
  dup2(control, STDIN_FILENO);
  const int page = fcntl(files.page.Get(), F_DUPFD, STDERR_FILENO + 1);
  const std::string page_text = std::to_string(page);
  std::string name = kFrontEndProgram;
  std::array<char*, 4> arguments = {name.data(), const_cast<char*>(listen.c_str()),
                                    const_cast<char*>(page_text.c_str()), nullptr};
  fexecve(files.program.Get(), arguments.data(), environ);
  syslog(LOG_ERR, "cannot start %s: %m", kFrontEndProgram);
  _exit(1);
}

}  // namespace

FrontEndFiles::FrontEndFiles()
    : program(OpenBeside(kFrontEndProgram)), page(OpenBeside(kPageFolder)) {}

WebHost::WebHost(const FrontEndFiles& files, std::string listen)
    : files_(files), listen_(std::move(listen)), lock_(LockDevice()) {
  sigset_t mask;
  sigemptyset(&mask);
  for (const int signal_number : {SIGCHLD, SIGTERM, SIGINT, SIGHUP}) {
    sigaddset(&mask, signal_number);
  }
  sigprocmask(SIG_BLOCK, &mask, &saved_mask_);
  signals_ = FileDescriptor(signalfd(-1, &mask, SFD_CLOEXEC | SFD_NONBLOCK));
}

WebHost::~WebHost() { EndFrontEnd(); }

bool WebHost::Run() {
  EndDeadTasksOfAll();
  StartFrontEnd();
  for (;;) {
    const bool has_room = requests_.size() + checks_.size() < kMostRequests;
    pollfd sources[] = {{signals_.Get(), POLLIN, 0}, {has_room ? control_.Get() : -1, POLLIN, 0}};
    poll(sources, std::size(sources), -1);
    if (sources[0].revents != 0 && !TakeSignal()) {
      return true;
    }
    if (sources[1].revents != 0 && !TakeMessage()) {
      EndFrontEnd();
      if (!has_listened_) {
        return false;
      }
      syslog(LOG_ERR, "the front end has ended; starting it again");
      poll(nullptr, 0, kRestartPauseMs);
      StartFrontEnd();
    }
  }
}

void WebHost::StartFrontEnd() {
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) {
    throw std::runtime_error(std::string("socket pair: ") + std::strerror(errno));
  }
  control_ = FileDescriptor(ends[0]);
  const FileDescriptor front_end_side(ends[1]);
  front_end_ = Fork([&]() -> int { BecomeFrontEnd(files_, front_end_side.Get(), listen_); });
}

// It ends by itself when its control socket closes, when it has answered what was asked.
void WebHost::EndFrontEnd() {
  control_.Close();
  if (front_end_ < 0) {
    return;
  }
  kill(front_end_, SIGTERM);
  const auto deadline = std::chrono::steady_clock::now() + kFrontEndGrace;
  while (waitpid(front_end_, nullptr, WNOHANG) == 0) {
    if (std::chrono::steady_clock::now() > deadline) {
      kill(front_end_, SIGKILL);
    }
    poll(nullptr, 0, 1);
  }
  front_end_ = -1;
}

pid_t WebHost::Fork(const std::function<int()>& body) {
  const pid_t pid = fork();
  if (pid == 0) {
    // What belongs to the launcher alone.
    control_.Close();
    signals_.Close();
    lock_.Close();
    requests_.clear();
    checks_.clear();
    sigprocmask(SIG_SETMASK, &saved_mask_, nullptr);
    int status = 1;
    try {
      status = body();
    } catch (const std::exception& error) {
      syslog(LOG_ERR, "%s", error.what());
    }
    _exit(status);
  }
  if (pid < 0) {
    syslog(LOG_ERR, "cannot fork: %m");
  }
  return pid;
}

bool WebHost::TakeMessage() {
  std::optional<ControlMessage> message = ReceiveControl(control_.Get());
  if (!message) {
    return false;
  }
  try {
    Serve(*message);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "message of the front end: %s", error.what());
  }
  return true;
}

void WebHost::Serve(ControlMessage& message) {
  if (message.kind != ControlKind::kRequest) {
    fcntl(message.exchange.Get(), F_SETFL, O_NONBLOCK);  // the launcher waits for no reader
  }
  switch (message.kind) {
    case ControlKind::kListening:
      if (listen_ != message.text || !has_listened_) {
        listen_ = message.text;  // where any free port was asked for, this one from now on
        std::cout << "serving '" << TheDevice().root << "' on http://" << listen_ << '/'
                  << std::endl;
        has_listened_ = true;
      }
      break;
    case ControlKind::kRequest:
      TakeRequest(std::move(message.exchange));
      break;
    case ControlKind::kSignIn:
      TakeSignIn(message.text, std::move(message.exchange));
      break;
    case ControlKind::kSignOut:
      SignOut(message.text);
      Answer(message.exchange.Get(), kHttpNoContent, Json::Value());
      break;
  }
}

void WebHost::TakeRequest(FileDescriptor exchange) {
  const pid_t pid = Fork([&] {
    ServeWebRequest(launcher_, std::move(exchange));
    return 0;
  });
  if (pid > 0) {
    requests_.insert(pid);
  }
}

void WebHost::TakeSignIn(const std::string& text, FileDescriptor exchange) {
  const Json::Value asked = ParseJson(text);
  const std::string user = asked["user"].asString();
  const std::chrono::seconds wait = gate_.Try(user, SignInGate::Clock::now());
  if (wait.count() > 0) {
    Json::Value body(Json::objectValue);
    body["error"] = "too many wrong passwords";
    body["retry_after"] = static_cast<Json::Int64>(wait.count());
    Answer(exchange.Get(), kHttpTooMany, body);
    return;
  }
  // Looking at a password takes its time, which is not the launcher's.
  const pid_t pid = Fork([&] { return IsPassword(user, asked["password"].asString()) ? 0 : 1; });
  if (pid > 0) {
    checks_.emplace(pid, SignInCheck{user, std::move(exchange)});
  }
}

void WebHost::FinishSignIn(const SignInCheck& check, bool is_password) {
  if (!is_password) {
    Refuse(check.exchange.Get(), kHttpUnauthorized, "wrong user name or password");
    return;
  }
  gate_.Succeeded(check.user);
  try {
    Json::Value body = SessionBody(check.user);
    body["session"] = SignIn(check.user);
    Answer(check.exchange.Get(), kHttpOk, body);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "sign in: %s", error.what());
  }
}

bool WebHost::TakeSignal() {
  signalfd_siginfo signal{};
  bool goes_on = true;
  while (read(signals_.Get(), &signal, sizeof signal) == sizeof signal) {
    goes_on = goes_on && signal.ssi_signo == SIGCHLD;
  }
  TakeEndedChildren();
  return goes_on;
}

void WebHost::TakeEndedChildren() {
  siginfo_t ended{};
  while (waitid(P_ALL, 0, &ended, WEXITED | WNOHANG) == 0 && ended.si_pid != 0) {
    const pid_t pid = ended.si_pid;
    if (const auto check = checks_.find(pid); check != checks_.end()) {
      const SignInCheck finished = std::move(check->second);
      checks_.erase(check);
      FinishSignIn(finished, ended.si_code == CLD_EXITED && ended.si_status == 0);
    } else if (pid == front_end_) {
      front_end_ = -1;  // its control socket tells the rest
    } else if (requests_.erase(pid) == 0) {
      TakeEndedWorker(ended);
    }
    ended.si_pid = 0;
  }
}

// A worker that was killed could not store its outcome.
void WebHost::TakeEndedWorker(const siginfo_t& ended) {
  if (ended.si_code != CLD_EXITED) {
    EndDeadTasksOfAll();
  }
}

void WebHost::EndDeadTasksOfAll() {
  for (const User& user : TheDevice().config.users) {
    const pid_t pid = Fork([&] {
      if (LumoLibUGIDSet(nullptr, user.name.c_str()) != 0) {
        throw std::runtime_error("cannot take on the identity of '" + user.name + "'");
      }
      EndDeadTasks(user.name);
      CloseStores();
      return 0;
    });
    if (pid > 0) {
      requests_.insert(pid);
    }
  }
}

}  // namespace Device
