// The launcher of a device that is reached over HTTP: one thread, which starts the front end, forks
// a process for each request, keeps the sessions, and takes leave of every process that ends.
#pragma once

#include <json/json.h>
#include <sys/types.h>

#include <csignal>
#include <functional>
#include <map>
#include <string>

#include "device/base/file_descriptor.h"
#include "device/host/launcher.h"
#include "device/host/request_queue.h"
#include "device/host/sessions.h"

namespace Device {

// What the front end's program needs. Opened before the device, behind which there may be no way to
// them.
struct FrontEndFiles {
  FileDescriptor program;
  FileDescriptor page;    // the folder with the page's files
  FileDescriptor socket;  // that listens, when systemd has handed one over

  // Opens the files beside the executable. Throws std::runtime_error.
  FrontEndFiles();
};

class WebHost {
 public:
  // The line to print about an ADDRESS:PORT that is served from now on.
  using Announcement = std::function<std::string(const std::string& address)>;

  // `listen` is ADDRESS:PORT. Takes the open device for this process alone; throws
  // std::runtime_error when another serves it.
  WebHost(FrontEndFiles files, std::string listen, Announcement announcement);
  ~WebHost();
  WebHost(const WebHost&) = delete;
  WebHost& operator=(const WebHost&) = delete;

  // Serves until SIGTERM, SIGINT or SIGHUP. False when the front end cannot listen; it has said
  // why. Jobs that are under way go on.
  bool Run();

 private:
  struct SignInCheck {
    std::string user;
    std::string client;
    FileDescriptor stream;
  };

  void StartFrontEnd();
  void EndFrontEnd();
  // The process id of a child that runs the body and leaves with its result.
  pid_t Fork(const std::function<int()>& body);

  // False when the front end is gone.
  bool TakeMessage();
  void Dispatch(const Json::Value& asked, FileDescriptor stream);
  void TakeAddress(const std::string& address);
  void TakeRequest(Json::Value asked, FileDescriptor stream);
  // Has the process started that is to answer, or refuses the request.
  void Enqueue(const Asker& asker, FileDescriptor stream,
               const std::function<pid_t(FileDescriptor&)>& start);
  void TakeSignIn(const Json::Value& asked, FileDescriptor stream);
  static void TakeSignOut(const Json::Value& asked, const FileDescriptor& stream);
  void FinishSignIn(const SignInCheck& check, bool is_password);

  // False when serving is to end.
  bool TakeSignal();
  void TakeEndedChildren();

  FrontEndFiles files_;
  std::string listen_;
  const Announcement announcement_;
  FileDescriptor lock_;
  FileDescriptor signals_;
  sigset_t saved_mask_{};
  FileDescriptor control_;
  pid_t front_end_ = -1;
  bool has_listened_ = false;
  Launcher launcher_;
  SignInGate gate_;
  std::map<pid_t, SignInCheck> checks_;
  RequestQueue queue_;
};

}  // namespace Device
