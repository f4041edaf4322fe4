// The commands of kavo-device. Each returns the exit status; what is wrong with the device or the
// command line itself is thrown as std::runtime_error.
#pragma once

#include <string>
#include <vector>

namespace Device {

enum ExitStatus : int {
  kExitDone = 0,
  kExitFailed = 1,  // the API or the job answered an error, or output was lost
  kExitUsage = 2    // wrong usage, or no such device
};

// Makes a device, from a configuration file or, when that is empty, the sample device with files.
int InitCommand(const std::string& folder, const std::string& config_file);

struct CallOptions {
  std::string folder;
  std::string user;
  std::string api = "KAVO.Zantro.Compress";
  std::string method;
  int version = 3;
  std::vector<std::string> params;  // NAME=TEXT or NAME:=JSON
};
// Makes one request and prints its outcome.
int CallCommand(const CallOptions& options);

struct CompressOptions {
  std::string folder;
  std::string user;
  std::vector<std::string> paths;  // the sources, then the archive
  std::string format;              // this and the next three: empty when not given
  std::string level;
  std::string mode;
  std::string password_file;
  std::string codepage;
  bool has_codepage = false;
};
// Runs one compress job to its end, showing its progress.
int CompressCommand(const CompressOptions& options);

// List a user's tasks or desktop notifications, a line each.
int TasksCommand(const std::string& folder, const std::string& user);
int NotificationsCommand(const std::string& folder, const std::string& user);

}  // namespace Device
