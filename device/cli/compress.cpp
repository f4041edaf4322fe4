// "compress": one job from start to end, with its progress.
#include <poll.h>
#include <strings.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <iostream>
#include <stdexcept>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/cli/client.h"
#include "device/cli/commands.h"
#include "device/cli/output.h"
#include "device/cli/progress_bar.h"
#include "device/platform/lumo/paths.h"
#include "platform/kavo/error_codes.h"

namespace Device {

namespace {

constexpr std::chrono::milliseconds kFirstPause(50);
constexpr std::chrono::milliseconds kLongestPause(1000);

volatile std::sig_atomic_t interrupted_by = 0;

void NoteInterrupt(int signal_number) {
  if (signal_number != SIGCHLD) {
    interrupted_by = signal_number;
  }
}

std::string FormatOf(const std::string& archive) {
  const std::string ending = archive.substr(std::min(archive.rfind('.'), archive.size()));
  for (const char* format : {".zip", ".7z"}) {
    if (strcasecmp(ending.c_str(), format) == 0) {
      return format + 1;
    }
  }
  throw std::runtime_error("'" + archive +
                           "' does not end in .zip or .7z: name it so, or give --format");
}

std::string ReadPassword(const std::string& file, bool is_for_zip) {
  const std::string text = ReadTextFile(file);
  std::string password = text.substr(0, text.find_first_of("\r\n"));
  const auto is_refused = [](char each) { return each < ' ' || each > '~'; };
  if (password.empty()) {
    throw std::runtime_error("password file '" + file + "' has an empty line");
  }
  if (is_for_zip && std::any_of(password.begin(), password.end(), is_refused)) {
    throw std::runtime_error("password file '" + file +
                             "': the password of a zip is printable ASCII");
  }
  return password;
}

Json::Value StartParams(const Target& target, const CompressOptions& options) {
  const std::string& archive = options.paths.back();
  const ResolvedPath resolved = Resolve(target.user, archive);
  if (resolved.error == 0 && resolved.share_path == "/" + resolved.share_name) {
    throw std::runtime_error("'" + archive +
                             "' is a shared folder: name an archive in it, such as '" +
                             resolved.share_path + "/" + resolved.share_name + ".zip'");
  }
  // Paths as the text of a JSON array, so that a name may hold a comma.
  Json::Value params =
      JsonObject({{"path", ToText(JsonArray({options.paths.begin(), options.paths.end() - 1}))},
                  {"dest_file_path", ToText(JsonArray({archive}))}});
  for (const auto& [name, value] : options.params) {
    if (!value.empty()) {
      params[name] = value;
    }
  }
  if (!params.isMember("format")) {
    params["format"] = FormatOf(archive);
  }
  if (params["mode"] == "synchronize") {
    params["mode"] = "synchroize";  // the API's word
  }
  if (!options.password_file.empty()) {
    params["password"] = ReadPassword(options.password_file, params["format"] == "zip");
  }
  return params;
}

class Job {
 public:
  Job(const Target& target, const CompressOptions& options)
      : target_(target),
        is_detached_(options.is_detached),
        client_(target, !is_detached_),
        dest_(options.paths.back()),
        params_(StartParams(target, options)),
        bar_(target.is_quiet) {}

  int Run() {
    const Outcome started = client_.Ask("start", params_);
    if (started.code != 0) {
      return EndWith(started.code);
    }
    task_id_ = started.data["taskid"].asString();
    if (!is_detached_) {
      return Follow();
    }
    Print(started.data, task_id_);
    return kExitDone;
  }

 private:
  int Follow() {
    for (std::chrono::milliseconds pause = kFirstPause;;
         pause = std::min(2 * pause, kLongestPause)) {
      // The worker's end, a signal, ends it early.
      poll(nullptr, 0, static_cast<int>(pause.count()));
      Launcher::Reap();
      const Json::Value task = client_.Task(task_id_);
      if (task.isNull()) {
        return EndWith(KAVO::kErrNoTask);  // another client has stopped or dismissed it
      }
      bar_.Show(task);
      if (task["state"] == "finished" || task["state"] == "failed") {
        client_.Ask("status", JsonObject({{"taskid", task_id_}}));  // which takes it off the list
        return End(task);
      }
      if (interrupted_by != 0) {
        return Stop(interrupted_by);
      }
    }
  }

  int Stop(int signal_number) {
    const int code = client_.Ask("stop", JsonObject({{"taskid", task_id_}})).code;
    if (code != 0) {
      return EndWith(code);
    }
    bar_.Clear();
    PrintError(dest_ + ": stopped");
    Print(JsonObject({{"dest_file_path", dest_}, {"state", "stopped"}, {"taskid", task_id_}}), "");
    return kExitSignal + signal_number;
  }

  int End(const Json::Value& task) const {
    const bool is_finished = task["state"] == "finished";
    if (!is_finished) {
      bar_.Clear();
    }
    for (const std::string& line : ErrorLines(task)) {
      PrintError(line);
    }
    Print(task, is_finished ? dest_ : "");
    return is_finished ? kExitDone : kExitFailed;
  }

  // What a request was answered.
  int EndWith(int code) const {
    Json::Value task = JsonObject({{"dest_file_path", dest_}, {"state", "failed"}});
    task["errors"].append(JsonObject({{"path", dest_}, {"code", code}}));
    return End(task);
  }

  void Print(const Json::Value& result, const std::string& text) const {
    if (target_.is_json) {
      PrintJson(result);
    } else if (!text.empty()) {
      std::cout << Shown(text) << '\n';
    }
  }

  const Target target_;
  const bool is_detached_;
  Client client_;
  const std::string dest_;
  const Json::Value params_;
  ProgressBar bar_;
  std::string task_id_;
};

}  // namespace

int CompressCommand(const Target& target, const CompressOptions& options) {
  Job job(target, options);
  for (const int signal_number : {SIGINT, SIGTERM, SIGHUP, SIGCHLD}) {
    if (std::signal(signal_number, NoteInterrupt) == SIG_IGN && signal_number == SIGHUP) {
      std::signal(signal_number, SIG_IGN);  // as nohup has it
    }
  }
  return job.Run();
}

}  // namespace Device
