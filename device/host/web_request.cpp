#include "device/host/web_request.h"

#include <syslog.h>

#include <stdexcept>

#include "device/base/frame.h"
#include "device/base/json_text.h"
#include "device/host/control.h"
#include "device/host/file_listing.h"
#include "device/host/http_status.h"
#include "device/host/sessions.h"
#include "device/host/task_events.h"
#include "device/model/device.h"
#include "device/platform/lumo/errors.h"
#include "device/tasks/task_store.h"
#include "device/tasks/task_view.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

void TakeIdentity(const std::string& session_id, const std::string& user) {
  if (LumoLibUGIDSet(session_id.c_str(), user.c_str()) != 0) {
    throw std::runtime_error("cannot take on the identity of '" + user + "'");
  }
}

void AnswerCall(Launcher& launcher, const std::string& user, const Json::Value& asked) {
  Request request;
  request.api = asked["api"].asString();
  request.method = asked["method"].asString();
  request.version = asked["version"].asInt();
  request.params = asked["params"];
  request.is_followed = asked["followed"].asBool();
  request.user = user;
  request.session_id = asked["session"].asString();
  const Outcome outcome = launcher.CallSafely(request);
  Json::Value body(Json::objectValue);
  body["code"] = outcome.code;
  body["data"] = outcome.data;
  Answer(TheDevice().outcome.Get(), kHttpOk, body);
}

void AnswerFiles(int exchange, const std::string& user, const std::string& path) {
  const Listing listing = ListFolder(user, path);
  if (listing.error == 0) {
    Answer(exchange, kHttpOk, listing.body);
    return;
  }
  Json::Value body(Json::objectValue);
  body["code"] = listing.error;
  body["error"] = ErrorText(listing.error);
  const bool is_forbidden = listing.error == kErrNoPrivilege || listing.error == kErrOutsideShare;
  Answer(exchange, is_forbidden ? kHttpForbidden : kHttpNotFound, body);
}

void AnswerTasks(int exchange, const std::string& user) {
  Json::Value body(Json::objectValue);
  body["tasks"] = Json::Value(Json::arrayValue);
  for (const TaskRow& row : EndDeadTasks(user)) {
    if (HasData(row)) {
      body["tasks"].append(TaskView(user, row));
    }
  }
  Answer(exchange, kHttpOk, body);
}

void AnswerCodes(int exchange) {
  Json::Value body(Json::objectValue);
  for (const auto& [code, text] : ErrorTexts()) {
    body[std::to_string(code)] = text;
  }
  Answer(exchange, kHttpOk, body);
}

void Serve(Launcher& launcher, const Json::Value& asked) {
  const int exchange = TheDevice().outcome.Get();
  const std::string kind = asked["kind"].asString();
  if (kind == kKindCodes) {
    AnswerCodes(exchange);
    return;
  }
  const std::string session_id = asked["session"].asString();
  const std::string user = UserOfSession(session_id);
  if (user.empty()) {
    Refuse(exchange, kHttpUnauthorized, "no session");
  } else if (kind == kKindCall) {
    AnswerCall(launcher, user, asked);
  } else if (kind == kKindSession) {
    Answer(exchange, kHttpOk, SessionBody(user));
  } else {
    TakeIdentity(session_id, user);
    if (kind == kKindFiles) {
      AnswerFiles(exchange, user, asked["path"].asString());
    } else if (kind == kKindTasks) {
      AnswerTasks(exchange, user);
    } else {
      StoreOf(user);  // throws when it cannot be opened, before a stream is promised
      if (Answer(exchange, kHttpOk, Json::Value())) {
        SendTaskEvents(exchange, user, session_id);
      }
    }
  }
}

}  // namespace

Json::Value SessionBody(const std::string& user) {
  Json::Value body(Json::objectValue);
  body["user"] = user;
  body["codepage"] = TheDevice().config.FindUser(user)->codepage;
  return body;
}

bool Answer(int exchange, int status, const Json::Value& body) {
  Json::Value frame(Json::objectValue);
  frame["status"] = status;
  frame["body"] = body;
  return WriteFrame(exchange, ToText(frame));
}

bool Refuse(int exchange, int status, const std::string& reason) {
  Json::Value body(Json::objectValue);
  body["error"] = reason;
  return Answer(exchange, status, body);
}

void ServeWebRequest(Launcher& launcher, FileDescriptor exchange) {
  // No worker may hold on to it.
  TheDevice().outcome = std::move(exchange);
  try {
    if (const std::optional<std::string> text = ReadFrame(TheDevice().outcome.Get())) {
      Serve(launcher, ParseJson(*text));
    }
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "web request: %s", error.what());
    Refuse(TheDevice().outcome.Get(), kHttpInternal, "the device cannot answer: see its log");
  }
  CloseStores();
}

}  // namespace Device
