// kavo-device: a network-storage device in a folder, for trying, watching and breaking the module.
#include <syslog.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <csignal>
#include <cstring>
#include <exception>
#include <functional>
#include <map>
#include <numeric>
#include <utility>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/cli/client.h"
#include "device/cli/commands.h"
#include "device/cli/output.h"
#include "device/host/web_host.h"
#include "device/model/device.h"
#include "device/platform/operations.h"

namespace {

using Device::CallOptions;
using Device::CompressOptions;
using Device::Target;

constexpr char kPasswordParam[] = "password";
constexpr char kExitStatus[] =
    "Exit status: 0 done; 1 the API or the job answered an error, or what was printed could not be "
    "written; 2 wrong usage, or the device cannot be opened or served; 130 stopped by Ctrl-C.";

struct CommandLine {
  Target target;
  std::string config_file;
  std::string trace_file;
  std::vector<std::string> fault_rules;
  std::string listen = "127.0.0.1:5080";
  std::string folder = "/";
  std::vector<std::string> task_ids;
  CallOptions call;
  CompressOptions compress;
  std::function<int()> run;  // the command
};

// Commands that act for a user have the option --user.
CLI::App* AddCommand(CLI::App& app, CommandLine& line, const char* name, const char* description,
                     bool is_users, const std::function<int()>& run) {
  CLI::App* const command = app.add_subcommand(name, description);
  command->add_option("DEVICE", line.target.folder, "Folder of the device")->required();
  if (is_users) {
    command->add_option("--user", line.target.user, "The signed-in user")->required();
  }
  command->add_flag("--json", line.target.is_json, "Print results as JSON");
  command->add_flag("-q,--quiet", line.target.is_quiet, "Print results and errors alone");
  command->callback([&line, run] { line.run = run; });
  return command;
}

void AddTraceOptions(CLI::App& command, CommandLine& line) {
  command.add_option("--trace", line.trace_file, "Append one JSON line per platform operation");
  command
      .add_option("--fault", line.fault_rules,
                  "Make an operation fail: CALL[#N]=RESULT[:CODE]; repeatable")
      ->take_all()
      ->allow_extra_args(false);
}

// In place of a relative path, the path below the user's home.
std::string AbsolutePath(const std::string& path) {
  return path.rfind('/', 0) == 0 ? path : std::string("/") + Device::kHomeShare + "/" + path;
}

void AddCompress(CLI::App& app, CommandLine& line) {
  CompressOptions& options = line.compress;
  CLI::App* const command =
      AddCommand(app, line, "compress", "Pack sources into one archive", true,
                 [&line] { return Device::CompressCommand(line.target, line.compress); });
  command
      ->add_option("PATH", options.paths,
                   "The sources, then the archive, such as /photo/trip /photo/trip.zip; a relative "
                   "path is taken below /home, the user's own")
      ->required()
      ->expected(2, -1)
      ->transform(AbsolutePath);
  command->add_option("--format", options.params["format"], "By default from the archive's ending")
      ->check(CLI::IsMember({"zip", "7z"}));
  command->add_option("--level", options.params["level"], "How hard to pack")
      ->check(CLI::IsMember({"store", "fastest", "normal", "best"}));
  command->add_option("--mode", options.params["mode"], "What to do with an archive that exists")
      ->check(CLI::IsMember({"add", "update", "freshen", "synchronize", "synchroize"}));
  command->add_option("--password-file", options.password_file,
                      "File whose first line is the archive's password");
  command->add_option("--codepage", options.params["codepage"],
                      "Code page of names in a zip, such as CP932");
  command->add_flag("--detach", options.is_detached, "Print the task's id, and leave it at work");
  AddTraceOptions(*command, line);
  command->footer("Prints the archive's path when the archive is whole. Ctrl-C stops the job.");
}

void AddTaskCommands(CLI::App& app, CommandLine& line) {
  AddCommand(app, line, "tasks", "List a user's tasks", true,
             [&line] { return Device::TasksCommand(line.target); });
  for (const auto& [name, description] :
       {std::pair{"status", "Show tasks"}, std::pair{"stop", "Stop tasks"},
        std::pair{"dismiss", "Take tasks that have ended off the list"}}) {
    AddCommand(app, line, name, description, true,
               [&line, command = name] {
                 return Device::TaskCommand(line.target, command, line.task_ids);
               })
        ->add_option("TASK", line.task_ids, "Ids of tasks")
        ->required();
  }
}

void AddCall(CLI::App& app, CommandLine& line) {
  CLI::App* const command =
      AddCommand(app, line, "call", "Make one web API request", true,
                 [&line] { return Device::CallCommand(line.target, line.call); });
  command->add_option("METHOD", line.call.method, "start, status or stop")->required();
  command->add_option("PARAMETER", line.call.params, "NAME=TEXT or NAME:=JSON");
  command->add_option("--api-version", line.call.version, "API version")->capture_default_str();
  command->add_option("--api", line.call.api, "API name")->capture_default_str();
  AddTraceOptions(*command, line);
}

int ServeCommand(const CommandLine& line) {
  Device::FrontEndFiles files;
  Device::OpenFor(line.target);
  const std::string& root = Device::TheDevice().root;
  const auto announce = [&](const std::string& address) {
    const std::string url = "http://" + address + "/";
    return line.target.is_json
               ? Device::ToUtf8Text(Device::JsonObject({{"device", root}, {"url", url}}))
               : "serving '" + root + "' on " + url;
  };
  return Device::WebHost(std::move(files), line.listen, announce).Run() ? Device::kExitDone
                                                                        : Device::kExitUsage;
}

void AddCommands(CLI::App& app, CommandLine& line) {
  AddCommand(app, line, "init", "Make a device", false, [&line] {
    return Device::InitCommand(line.target, line.config_file);
  })->add_option("--config", line.config_file, "A device.json; without it, a sample device");
  AddCompress(app, line);
  AddTaskCommands(app, line);
  AddCommand(app, line, "ls", "List a folder as a user sees it", true,
             [&line] { return Device::LsCommand(line.target, line.folder); })
      ->add_option("PATH", line.folder, "Such as /photo; by default the shared folders")
      ->transform(AbsolutePath);
  AddCommand(app, line, "notifications", "List a user's desktop notifications", true,
             [&line] { return Device::NotificationsCommand(line.target); });
  AddCall(app, line);
  CLI::App* const serve = AddCommand(app, line, "serve", "Serve the device over HTTP", false,
                                     [&line] { return ServeCommand(line); });
  serve->add_option("--listen", line.listen, "ADDRESS:PORT, unless systemd hands over a socket")
      ->capture_default_str();
  AddTraceOptions(*serve, line);
}

std::size_t Distance(const std::string& one, const std::string& other) {
  std::vector<std::size_t> row(other.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t line = 1; line <= one.size(); ++line) {
    std::size_t corner = std::exchange(row[0], line);
    for (std::size_t at = 1; at <= other.size(); ++at) {
      const std::size_t replaced = corner + (one[line - 1] == other[at - 1] ? 0 : 1);
      corner = row[at];
      row[at] = std::min({replaced, row[at] + 1, row[at - 1] + 1});
    }
  }
  return row.back();
}

// Names the nearest one there is: the library would list what else is wrong.
void RefuseUnknown(const CLI::App& app, const std::string& command) {
  std::map<std::size_t, std::string> nearest;
  for (const CLI::App* const known : app.get_subcommands(nullptr)) {
    nearest.emplace(Distance(command, known->get_name()), known->get_name());
  }
  if (nearest.begin()->first != 0) {
    throw std::runtime_error("no command '" + command + "'; the nearest is '" +
                             nearest.begin()->second + "'");
  }
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
  app.set_version_flag("--version", "kavo-device " KAVO_VERSION);
  app.require_subcommand(1);
  app.footer(kExitStatus);
  CommandLine line;
  AddCommands(app, line);
  if (argc > 1 && argv[1][0] != '-') {
    RefuseUnknown(app, argv[1]);
  }
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? Device::kExitDone : Device::kExitUsage;
  }
  HidePasswords(argc, argv);
  const std::string command = app.get_subcommands().front()->get_name();
  const bool is_watched = command == "serve" || command == "call" || !line.trace_file.empty() ||
                          !line.fault_rules.empty();  // others say what users need to know
  openlog("kavo-device", LOG_PID | (is_watched ? LOG_PERROR : 0), LOG_USER);
  for (const std::string& rule : line.fault_rules) {
    Device::AddFault(rule);
  }
  if (!line.trace_file.empty()) {
    Device::OpenTrace(line.trace_file);
  }
  return line.run();
}

}  // namespace

int main(int argc, char** argv) {
  Device::OccupyStandardStreams();
  Device::WatchOutput();
  std::signal(SIGPIPE, SIG_IGN);
  int status = Device::kExitUsage;
  try {
    status = Run(argc, argv);
  } catch (const Device::Failure& failure) {
    Device::PrintError(failure.what());
    status = Device::kExitFailed;
  } catch (const std::exception& error) {
    Device::PrintError(error.what());
  }
  return Device::FinishOutput() ? status : Device::kExitFailed;
}
