#include "device/host/web_host.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <syslog.h>
#include <systemd/sd-daemon.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <iostream>
#include <memory>
#include <stdexcept>
#include <system_error>
#include <utility>

#include "device/base/child_process.h"
#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/base/open_below.h"
#include "device/base/socket_message.h"
#include "device/host/web_request.h"
#include "device/host/wire.h"
#include "device/model/device.h"

namespace Device {

namespace {

constexpr char kFrontEndProgram[] = "kavo-web";
constexpr char kPageFolder[] = "page";
constexpr int kRestartPauseMs = 500;
constexpr std::chrono::seconds kFrontEndGrace(6);

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

// The header that gives the client the session's id, or takes it away.
std::pair<std::string, std::string> SessionCookie(const std::string& value) {
  return {"Set-Cookie",
          std::string(kSessionCookie) + "=" + value + "; Path=/; HttpOnly; SameSite=Strict"};
}

// Of a client who is not signed in, told apart from a user's name.
std::string AddressOf(const Json::Value& asked) { return "address " + asked["client"].asString(); }

}  // namespace

FrontEndFiles::FrontEndFiles()
    : program(OpenBesideProgram(kFrontEndProgram, O_RDONLY)),
      page(OpenBesideProgram(kPageFolder, O_RDONLY)),
      socket(sd_listen_fds(1) > 0 ? SD_LISTEN_FDS_START : -1) {}

WebHost::WebHost(FrontEndFiles files, std::string listen, Announcement announcement)
    : files_(std::move(files)),
      listen_(std::move(listen)),
      announcement_(std::move(announcement)),
      lock_(LockDevice()) {
  if (!Fence::IsSupported()) {
    std::cerr << "kavo-device: the archiver will not be fenced: the kernel has no Landlock\n";
  }
  RemoveLeftoversOfAll();
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
  StartFrontEnd();
  for (;;) {
    pollfd sources[] = {{signals_.Get(), POLLIN, 0}, {control_.Get(), POLLIN, 0}};
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
    ThrowErrno("socket pair");
  }
  control_ = FileDescriptor(ends[0]);
  const FileDescriptor front_end_side(ends[1]);
  ProgramStart start;
  start.program = PathOf(files_.program.Get());
  start.arguments = {kFrontEndProgram, listen_, std::to_string(files_.page.Get()),
                     std::to_string(files_.socket.Get())};
  start.input = front_end_side.Get();
  start.errors = STDERR_FILENO;
  start.kept = {files_.page.Get(), files_.socket.Get()};
  try {
    front_end_ = ChildProcess::Start(start).Release();
  } catch (const std::system_error& error) {
    syslog(LOG_ERR, "cannot start %s: %s", kFrontEndProgram, error.what());
  }
}

// It ends by itself when its control socket closes, when it has answered what was asked.
void WebHost::EndFrontEnd() {
  control_.Close();
  if (front_end_ < 0) {
    return;
  }
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
  try {
    return ChildProcess::Run([&] {
             // What belongs to the launcher alone.
             control_.Close();
             signals_.Close();
             files_.socket.Close();
             lock_.Close();
             queue_.Clear();
             checks_.clear();
             sigprocmask(SIG_SETMASK, &saved_mask_, nullptr);
             return body();
           })
        .Release();
  } catch (const std::system_error& error) {
    syslog(LOG_ERR, "cannot start a process: %s", error.what());
    return -1;
  }
}

bool WebHost::TakeMessage() {
  std::optional<SocketMessage> message = ReceiveMessage(control_.Get(), kMostMessageBytes);
  if (!message) {
    return false;
  }
  try {
    Dispatch(ParseJson(message->bytes), std::move(message->descriptor));
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "message of the front end: %s", error.what());
  }
  return std::cout.good();  // it does not serve where it could not say
}

void WebHost::Dispatch(const Json::Value& asked, FileDescriptor stream) {
  const std::string kind = asked["kind"].asString();
  if (kind == kKindListening) {
    TakeAddress(asked["address"].asString());
  } else if (kind == kKindSignIn || kind == kKindSignOut) {
    fcntl(stream.Get(), F_SETFL, O_NONBLOCK);  // the launcher waits for no reader
    kind == kKindSignIn ? TakeSignIn(asked, std::move(stream)) : TakeSignOut(asked, stream);
  } else {
    TakeRequest(asked, std::move(stream));
  }
}

void WebHost::TakeAddress(const std::string& address) {
  if (listen_ != address || !has_listened_) {
    listen_ = address;  // where any free port was asked for, this one from now on
    std::cout << announcement_(listen_) << std::endl;
    has_listened_ = std::cout.good();
    sd_notify(0, "READY=1");
  }
}

void WebHost::TakeRequest(Json::Value asked, FileDescriptor stream) {
  const std::string session = asked["session"].asString();
  const std::string user = UserOfSession(session);
  if (user.empty() && asked["kind"] != kKindCodes) {
    SendAnswer(stream.Get(), Refusal(kHttpUnauthorized, "no session"));
    return;
  }
  asked["followed"] = queue_.HasStream(session);
  const std::string client = user.empty() ? AddressOf(asked) : "user " + user;
  Enqueue({client, session, asked["kind"] == kKindEvents}, std::move(stream),
          [this, asked](FileDescriptor& taken) {
            return Fork([&] {
              ServeWebRequest(launcher_, std::move(taken), asked);
              return 0;
            });
          });
}

void WebHost::Enqueue(const Asker& asker, FileDescriptor stream,
                      const std::function<pid_t(FileDescriptor&)>& start) {
  const auto shared = std::make_shared<FileDescriptor>(std::move(stream));
  if (!queue_.Add(asker, [=] { return start(*shared); })) {
    SendAnswer(shared->Get(), Refusal(kHttpTooMany,
                                      asker.is_stream ? "too many event streams"
                                                      : "too many requests at the same time",
                                      kRetrySeconds));
  }
}

void WebHost::TakeSignIn(const Json::Value& asked, FileDescriptor stream) {
  // Looking at a password takes its time, which is not the launcher's.
  Enqueue({AddressOf(asked), "", false}, std::move(stream), [this, asked](FileDescriptor& taken) {
    const std::string user = asked["user"].asString();
    const std::chrono::seconds wait = gate_.Try(user, AddressOf(asked), SignInGate::Clock::now());
    if (wait.count() > 0) {
      SendAnswer(taken.Get(),
                 Refusal(kHttpTooMany, "too many wrong passwords", std::to_string(wait.count())));
      return -1;
    }
    const pid_t pid = Fork([&] { return IsPassword(user, asked["password"].asString()) ? 0 : 1; });
    if (pid > 0) {
      checks_.emplace(pid, SignInCheck{user, AddressOf(asked), std::move(taken)});
    }
    return pid;
  });
}

void WebHost::TakeSignOut(const Json::Value& asked, const FileDescriptor& stream) {
  SignOut(asked["session"].asString());
  Answer answer(kHttpNoContent);
  answer.headers = {SessionCookie("; Max-Age=0")};
  SendAnswer(stream.Get(), answer);
}

void WebHost::FinishSignIn(const SignInCheck& check, bool is_password) {
  if (!is_password) {
    SendAnswer(check.stream.Get(), Refusal(kHttpUnauthorized, "wrong user name or password"));
    return;
  }
  gate_.Succeeded(check.user, check.client);
  try {
    Answer answer(kHttpOk, SessionBody(check.user));
    answer.headers = {SessionCookie(SignIn(check.user))};
    SendAnswer(check.stream.Get(), answer);
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
    }
    queue_.TakeEnd(pid);  // or it was a worker: who reads its task sees what it has stored
    ended.si_pid = 0;
  }
}

}  // namespace Device
