// "compress": one job from start to end, with its progress.
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <csignal>
#include <iostream>
#include <stdexcept>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/cli/commands.h"
#include "device/host/launcher.h"
#include "device/host/sessions.h"
#include "device/model/device.h"
#include "device/platform/lumo/errors.h"

namespace Device {

namespace {

constexpr char kApi[] = "KAVO.Zantro.Compress";
constexpr int kApiVersion = 3;
constexpr std::chrono::milliseconds kFirstPause(50);
constexpr std::chrono::milliseconds kLongestPause(1000);

constexpr int kBarWidth = 40;
constexpr char kEraseLine[] = "\r\x1b[K";

volatile std::sig_atomic_t is_interrupted = 0;

void NoteInterrupt(int signal_number) {
  if (signal_number != SIGCHLD) {
    is_interrupted = 1;
  }
}

// Paths as the text of a JSON array, so that a name may hold a comma.
std::string ListText(std::vector<std::string>::const_iterator begin,
                     std::vector<std::string>::const_iterator end) {
  return ToText(JsonArray({begin, end}));
}

bool EndsWith(const std::string& text, const std::string& ending) {
  return text.size() >= ending.size() &&
         text.compare(text.size() - ending.size(), ending.size(), ending) == 0;
}

Json::Value StartParams(const CompressOptions& options) {
  const auto dest = options.paths.end() - 1;
  Json::Value params = JsonObject({{"path", ListText(options.paths.begin(), dest)},
                                   {"dest_file_path", ListText(dest, options.paths.end())},
                                   {"format", !options.format.empty()  ? options.format
                                              : EndsWith(*dest, ".7z") ? "7z"
                                                                       : "zip"}});
  if (!options.level.empty()) {
    params["level"] = options.level;
  }
  if (!options.mode.empty()) {
    params["mode"] = options.mode;
  }
  if (!options.codepage.empty()) {
    params["codepage"] = options.codepage;
  }
  if (!options.password_file.empty()) {
    const std::string text = ReadTextFile(options.password_file);
    const std::string password = text.substr(0, text.find_first_of("\r\n"));
    if (password.empty()) {
      throw std::runtime_error("password file '" + options.password_file + "' has an empty line");
    }
    params["password"] = password;
  }
  return params;
}

void PrintError(const std::string& path, int code) {
  std::cout << path << ": " << code << ' ' << ErrorText(code) << '\n';
}

// A job's progress on standard output: a bar on a terminal, a line per change elsewhere.
class ProgressDisplay {
 public:
  ProgressDisplay();

  // `percent` from 0 to 100. Draws nothing when it has not changed.
  void Show(int percent);
  // Takes the bar off the terminal.
  void Clear() const;

 private:
  bool is_terminal_;
  int shown_ = -1;
};

ProgressDisplay::ProgressDisplay() : is_terminal_(isatty(STDOUT_FILENO) != 0) {}

void ProgressDisplay::Show(int percent) {
  if (percent == shown_) {
    return;
  }
  shown_ = percent;
  if (!is_terminal_) {
    std::cout << percent << " %" << std::endl;
    return;
  }
  const int filled = std::clamp(percent, 0, 100) * kBarWidth / 100;
  std::cout << kEraseLine << '[' << std::string(filled, '#') << std::string(kBarWidth - filled, ' ')
            << "] " << percent << " %" << std::flush;
}

void ProgressDisplay::Clear() const {
  if (is_terminal_) {
    std::cout << kEraseLine << std::flush;
  }
}

// One job: the requests that a client of the API makes.
class Job {
 public:
  explicit Job(const CompressOptions& options)
      : dest_(options.paths.back()), params_(StartParams(options)), user_(options.user) {
    session_id_ = SignIn(user_);
  }

  int Run() {
    const Outcome started = Ask("start", params_);
    if (started.code != 0) {
      PrintError(dest_, started.code);
      return kExitFailed;
    }
    task_id_ = started.data["taskid"].asString();
    return Follow();
  }

 private:
  Outcome Ask(const std::string& method, const Json::Value& params) {
    Request request;
    request.api = kApi;
    request.method = method;
    request.version = kApiVersion;
    request.params = params;
    request.user = user_;
    request.session_id = session_id_;
    request.is_followed = true;
    return launcher_.Call(request);
  }

  Outcome AskAboutTask(const std::string& method) {
    return Ask(method, JsonObject({{"taskid", task_id_}}));
  }

  int Follow() {
    ProgressDisplay display;
    std::chrono::milliseconds pause = kFirstPause;
    for (;;) {
      poll(nullptr, 0,
           static_cast<int>(pause.count()));  // the worker's end, a signal, ends it early
      Launcher::Reap();
      pause = std::min(2 * pause, kLongestPause);
      if (is_interrupted != 0) {
        display.Clear();
        return Stop();
      }
      const Outcome outcome = AskAboutTask("status");
      if (outcome.code != 0 || outcome.data["finished"].asBool()) {
        display.Clear();
        return Report(outcome);
      }
      display.Show(static_cast<int>(std::lround(outcome.data["progress"].asDouble() * 100)));
    }
  }

  int Stop() {
    const Outcome outcome = AskAboutTask("stop");
    if (outcome.code != 0) {
      PrintError(dest_, outcome.code);
    } else {
      std::cout << dest_ << ": stopped\n";
    }
    return kExitFailed;
  }

  int Report(const Outcome& outcome) const {
    if (outcome.code != 0) {
      // Another client has stopped the task or has seen its end, or the request itself went wrong.
      PrintError(dest_, outcome.code);
      return kExitFailed;
    }
    if (!outcome.data.isMember("errors")) {
      std::cout << dest_ << '\n';
      return kExitDone;
    }
    const Json::Value& errors = outcome.data["errors"];
    for (const Json::Value& item : errors) {
      const std::string path = item["path"].asString();
      PrintError(path.empty() ? dest_ : path, item["code"].asInt());
    }
    if (errors.empty()) {
      std::cout << dest_ << ": failed without a reason\n";
    }
    return kExitFailed;
  }

  const std::string dest_;
  const Json::Value params_;
  const std::string user_;
  std::string session_id_;
  std::string task_id_;
  Launcher launcher_;
};

}  // namespace

int CompressCommand(const CompressOptions& options) {
  Open(options.folder);
  Job job(options);
  for (const int signal_number : {SIGINT, SIGTERM, SIGHUP, SIGCHLD}) {
    std::signal(signal_number, NoteInterrupt);
  }
  return job.Run();
}

}  // namespace Device
