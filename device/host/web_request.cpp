#include "device/host/web_request.h"

#include <syslog.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <optional>
#include <stdexcept>
#include <utility>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/base/shortage.h"
#include "device/host/body.h"
#include "device/host/sessions.h"
#include "device/host/task_events.h"
#include "device/host/user_files.h"
#include "device/host/wire.h"
#include "device/model/device.h"
#include "device/platform/host_services.h"
#include "device/platform/lumo/errors.h"
#include "device/platform/lumo/identity.h"
#include "device/tasks/task_store.h"
#include "device/tasks/user_tasks.h"

namespace Device {

namespace {

// Beside what a process has at its start: some 64 MiB in all.
constexpr std::size_t kMostMemory = std::size_t{57} << 20U;
constexpr std::chrono::seconds kStorePatience(2);
constexpr std::chrono::seconds kArchiveTime(15);
constexpr std::chrono::seconds kSizeTime(30);

void TakeIdentity(const std::string& session_id, const std::string& user) {
  if (SwitchTo(session_id.c_str(), user.c_str()) != 0) {
    throw std::runtime_error("cannot take on the identity of '" + user + "'");
  }
}

// What the client sends, in its time: a body, or a path. Nothing when it breaks off.
std::optional<std::string> Receive(int stream, bool has_body) {
  if (!has_body) {
    return ReadFrame(stream);
  }
  SendAnswer(stream, Answer(kHttpContinue));
  std::string body;
  std::optional<std::string> part;
  while ((part = ReadFrame(stream)) && !part->empty()) {
    body += *part;
  }
  return part ? std::optional(std::move(body)) : std::nullopt;
}

Answer RefusalFor(Shortage shortage) {
  if (TheHost().worker > 0) {
    kill(TheHost().worker, SIGKILL);  // it waits for its task's data, which will not come
  }
  return shortage == Shortage::kMemory
             ? Refusal(kHttpTooLarge, "the request takes too much memory")
             : Refusal(kHttpUnavailable, "the user's tasks are locked", "2");
}

Answer CallApi(Launcher& launcher, const std::string& user, const Json::Value& asked,
               std::string body) {
  Json::Value call;
  try {
    call = ApiRequest(ParseBody(asked["type"].asString(), std::move(body)));
  } catch (const std::runtime_error& error) {
    return Refusal(kHttpBadRequest, error.what());
  }
  const Request request{call["api"].asString(),
                        call["method"].asString(),
                        call["version"].asInt(),
                        std::move(call["params"]),  // may be large, and a worker inherits it
                        user,
                        asked["session"].asString(),
                        asked["followed"].asBool()};
  const Outcome outcome = launcher.CallSafely(request);
  return outcome.code != 0 && TheShortage() != Shortage::kNone
             ? RefusalFor(TheShortage())
             : Answer(kHttpOk, JsonObject({{"code", outcome.code}, {"data", outcome.data}}));
}

Json::Value CodesBody() {
  Json::Value body(Json::objectValue);
  for (const auto& [code, text] : ErrorTexts()) {
    body[std::to_string(code)] = text;
  }
  return body;
}

void StreamEvents(int stream, const std::string& user, const std::string& session_id) {
  StoreOf(user);  // throws when it cannot be opened, before a stream is promised
  if (!SendAnswer(stream, Answer(kHttpOk))) {
    return;
  }
  try {
    SendTaskEvents(stream, user, session_id);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "event stream: %s", error.what());  // the stream ends, and is asked for again
  }
}

Json::Value PathsOf(const Json::Value& asked, std::string body) {
  try {
    Json::Value paths = ParseBody(asked["type"].asString(), std::move(body))["paths"];
    const auto is_text = [](const Json::Value& path) { return path.isString(); };
    if (paths.isArray() && std::all_of(paths.begin(), paths.end(), is_text)) {
      return paths;
    }
    throw std::runtime_error("'paths' is missing or no list of texts");
  } catch (const std::runtime_error& error) {
    throw Refused(kHttpBadRequest, error.what());
  }
}

void AnswerRequest(Launcher& launcher, const Json::Value& asked) {
  const int stream = launcher.AnswerStream().Get();
  const std::string kind = asked["kind"].asString();
  const std::string session_id = asked["session"].asString();
  std::optional<std::string> sent = Receive(stream, asked.isMember("type"));
  if (!sent) {
    return;
  }
  const std::string user = UserOfSession(session_id);
  const auto answer = [&](auto text) { SendAnswer(stream, Answer(kHttpOk, std::move(text))); };
  if (kind == kKindCodes) {
    answer(CodesBody());
  } else if (user.empty()) {
    SendAnswer(stream, Refusal(kHttpUnauthorized, "no session"));
  } else if (kind == kKindSession) {
    answer(SessionBody(user));
  } else {
    TakeIdentity(session_id, user);
    if (kind == kKindCall) {
      SendAnswer(stream, CallApi(launcher, user, asked, std::move(*sent)));
    } else if (kind == kKindFiles) {
      answer(ListFolder(user, *sent));
    } else if (kind == kKindDownload) {
      HandOverFile(stream, user, *sent);
    } else if (kind == kKindArchive) {
      answer(ListArchive(user, *sent, Patience(stream, kArchiveTime)));
    } else if (kind == kKindDestination) {
      answer(CheckDestination(user, *sent));
    } else if (kind == kKindSize) {
      answer(SizeOf(user, PathsOf(asked, std::move(*sent)), Patience(stream, kSizeTime)));
    } else if (kind == kKindTasks) {
      answer(TaskList(user));
    } else {
      StreamEvents(stream, user, session_id);
    }
  }
}

}  // namespace

Json::Value SessionBody(const std::string& user) {
  return JsonObject({{"user", user}, {"codepage", TheDevice().config.FindUser(user)->codepage}});
}

void ServeWebRequest(Launcher& launcher, FileDescriptor stream, const Json::Value& asked) {
  launcher.AnswerStream() = std::move(stream);
  const int answer = launcher.AnswerStream().Get();
  try {
    LimitMemory(kMostMemory);
    Database::SetPatience(kStorePatience);
    AnswerRequest(launcher, asked);
  } catch (const Refused& refused) {
    SendAnswer(answer, refused.answer);
  } catch (const std::exception& error) {
    if (dynamic_cast<const Json::RuntimeError*>(&error) != nullptr) {
      TheShortage() = Shortage::kMemory;  // so the library says it
    }
    syslog(LOG_ERR, "web request: %s", error.what());
    SendAnswer(answer, TheShortage() != Shortage::kNone
                           ? RefusalFor(TheShortage())
                           : Refusal(kHttpInternal, "the device cannot answer: see its log"));
  }
  CloseStores();
}

}  // namespace Device
