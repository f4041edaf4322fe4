// kavo-device: a network-storage device in a folder, for trying, watching and breaking the module.
#include <syslog.h>

#include <CLI/CLI.hpp>
#include <csignal>
#include <cstring>
#include <exception>
#include <iostream>

#include "device/base/file_io.h"
#include "device/cli/commands.h"
#include "device/cli/output.h"
#include "device/host/web_host.h"
#include "device/model/device.h"
#include "device/platform/operations.h"

namespace {

using Device::CallOptions;
using Device::CompressOptions;

constexpr char kPasswordParam[] = "password";

struct CommandLine {
  std::string folder;
  std::string user;
  std::string config_file;
  std::string trace_file;
  std::vector<std::string> fault_rules;
  std::string listen = "127.0.0.1:5080";
  CallOptions call;
  CompressOptions compress;
};

void AddDeviceOption(CLI::App& command, CommandLine& line) {
  command.add_option("device", line.folder, "Folder of the device")->required();
}

void AddUserOptions(CLI::App& command, CommandLine& line) {
  AddDeviceOption(command, line);
  command.add_option("--user", line.user, "The signed-in user")->required();
}

void AddTraceOptions(CLI::App& command, CommandLine& line) {
  command.add_option("--trace", line.trace_file, "Append one JSON line per platform operation");
  command
      .add_option("--fault", line.fault_rules,
                  "Make an operation fail: CALL[#N]=RESULT[:CODE]; repeatable")
      ->take_all()
      ->allow_extra_args(false);
}

CLI::App* AddInit(CLI::App& app, CommandLine& line) {
  CLI::App* const command = app.add_subcommand("init", "Make a device");
  AddDeviceOption(*command, line);
  command->add_option("--config", line.config_file, "A device.json; without it, a sample device");
  return command;
}

CLI::App* AddCall(CLI::App& app, CommandLine& line) {
  CLI::App* const command = app.add_subcommand("call", "Make one web API request");
  AddUserOptions(*command, line);
  command->add_option("method", line.call.method, "start, status or stop")->required();
  command->add_option("params", line.call.params, "Parameters: NAME=TEXT or NAME:=JSON");
  command->add_option("--version", line.call.version, "API version")->capture_default_str();
  command->add_option("--api", line.call.api, "API name")->capture_default_str();
  AddTraceOptions(*command, line);
  return command;
}

CLI::App* AddCompress(CLI::App& app, CommandLine& line) {
  CompressOptions& options = line.compress;
  CLI::App* const command = app.add_subcommand("compress", "Pack sources into one archive");
  AddUserOptions(*command, line);
  command->add_option("paths", options.paths, "SOURCE... DEST, such as /photo/trip /photo/trip.zip")
      ->required()
      ->expected(2, -1);
  command->add_option("--format", options.format, "By default from DEST's ending")
      ->check(CLI::IsMember({"zip", "7z"}));
  command->add_option("--level", options.level)
      ->check(CLI::IsMember({"store", "fastest", "normal", "best"}));
  command->add_option("--mode", options.mode, "What to do with an archive that exists")
      ->check(CLI::IsMember({"add", "update", "freshen", "synchroize"}));
  command->add_option("--password-file", options.password_file,
                      "File whose first line is the archive's password");
  command->add_option("--codepage", options.codepage, "Code page of names in a zip, such as CP932");
  AddTraceOptions(*command, line);
  return command;
}

CLI::App* AddServe(CLI::App& app, CommandLine& line) {
  CLI::App* const command = app.add_subcommand("serve", "Serve the device over HTTP");
  AddDeviceOption(*command, line);
  command->add_option("--listen", line.listen, "ADDRESS:PORT")->capture_default_str();
  AddTraceOptions(*command, line);
  return command;
}

// Takes passwords off the process list, on which a worker shows what its starter was called with.
void HidePasswords(int argc, char** argv) {
  for (int index = 1; index < argc; ++index) {
    char* const value = std::strncmp(argv[index], kPasswordParam, std::strlen(kPasswordParam)) == 0
                            ? std::strchr(argv[index], '=')
                            : nullptr;
    if (value != nullptr) {
      std::memset(value + 1, '*', std::strlen(value + 1));
    }
  }
}

int Run(int argc, char** argv) {
  CLI::App app("A network-storage device in a folder.", "kavo-device");
  app.require_subcommand(1);
  CommandLine line;
  CLI::App* const init = AddInit(app, line);
  CLI::App* const call = AddCall(app, line);
  CLI::App* const compress = AddCompress(app, line);
  CLI::App* const serve = AddServe(app, line);
  CLI::App* const tasks = app.add_subcommand("tasks", "List a user's tasks");
  AddUserOptions(*tasks, line);
  CLI::App* const notifications =
      app.add_subcommand("notifications", "List a user's desktop notifications");
  AddUserOptions(*notifications, line);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? Device::kExitDone : Device::kExitUsage;
  }
  HidePasswords(argc, argv);
  for (const std::string& rule : line.fault_rules) {
    Device::AddFault(rule);
  }
  if (!line.trace_file.empty()) {
    Device::OpenTrace(line.trace_file);
  }
  line.call.folder = line.compress.folder = line.folder;
  line.call.user = line.compress.user = line.user;
  if (init->parsed()) {
    return Device::InitCommand(line.folder, line.config_file);
  }
  if (call->parsed()) {
    return Device::CallCommand(line.call);
  }
  if (compress->parsed()) {
    return Device::CompressCommand(line.compress);
  }
  if (serve->parsed()) {
    const Device::FrontEndFiles files;
    Device::Open(line.folder);
    return Device::WebHost(files, line.listen).Run() ? Device::kExitDone : Device::kExitUsage;
  }
  if (tasks->parsed()) {
    return Device::TasksCommand(line.folder, line.user);
  }
  return Device::NotificationsCommand(line.folder, line.user);
}

}  // namespace

int main(int argc, char** argv) {
  Device::OccupyStandardStreams();
  Device::WatchOutput();
  openlog("kavo-device", LOG_PID | LOG_PERROR, LOG_USER);
  std::signal(SIGPIPE, SIG_IGN);
  int status = Device::kExitUsage;
  try {
    status = Run(argc, argv);
  } catch (const std::exception& error) {
    std::cerr << "kavo-device: " << error.what() << '\n';
  }
  return Device::FinishOutput() ? status : Device::kExitFailed;
}
