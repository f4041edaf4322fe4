// The commands of kavo-device. Each returns the exit status; what is wrong with the device or the
// command line itself is thrown as std::runtime_error.
#pragma once

#include <map>
#include <string>
#include <vector>

namespace Device {

enum ExitStatus : int {
  kExitDone = 0,
  kExitFailed = 1,   // the API or the job answered an error, or output was lost
  kExitUsage = 2,    // wrong usage, or the device cannot be opened or served
  kExitSignal = 128  // and the number of the signal that stopped the job
};

// What every command is told.
struct Target {
  std::string folder;
  std::string user;
  bool is_json = false;   // results as JSON
  bool is_quiet = false;  // results and errors alone
};

// Makes a device, from a configuration file or, when that is empty, the sample device with files.
int InitCommand(const Target& target, const std::string& config_file);

struct CallOptions {
  std::string api = "KAVO.Zantro.Compress";
  std::string method;
  int version = 3;
  std::vector<std::string> params;  // NAME=TEXT or NAME:=JSON
};
// Makes one request and prints its outcome.
int CallCommand(const Target& target, const CallOptions& options);

struct CompressOptions {
  std::vector<std::string> paths;             // the sources, then the archive
  std::map<std::string, std::string> params;  // further ones of "start"; empty: not given
  std::string password_file;
  bool is_detached = false;
};
// Starts one compress job; unless it is detached, runs it to its end, showing its progress.
int CompressCommand(const Target& target, const CompressOptions& options);

// Lists a user's tasks, a folder as the user sees it, desktop notifications.
int TasksCommand(const Target& target);
int LsCommand(const Target& target, const std::string& folder);
int NotificationsCommand(const Target& target);

// "status" shows tasks, "stop" stops them, "dismiss" takes those that have ended off the list.
int TaskCommand(const Target& target, const std::string& command,
                const std::vector<std::string>& ids);

}  // namespace Device
