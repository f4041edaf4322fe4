// "call": one request through the module.
#include <iostream>
#include <stdexcept>

#include "device/base/json_text.h"
#include "device/cli/client.h"
#include "device/cli/commands.h"
#include "device/host/launcher.h"
#include "device/host/sessions.h"

namespace Device {

namespace {

// NAME:=JSON, or NAME=TEXT.
void AddParam(const std::string& text, Json::Value& params) {
  const std::size_t equals = text.find('=');
  if (equals == std::string::npos || equals == 0) {
    throw std::runtime_error("parameter '" + text + "': expected NAME=TEXT or NAME:=JSON");
  }
  const std::string value = text.substr(equals + 1);
  if (text[equals - 1] != ':') {
    params[text.substr(0, equals)] = value;
    return;
  }
  const std::string name = text.substr(0, equals - 1);
  try {
    params[name] = ParseJson(value, kParamDepth);
  } catch (const std::exception& error) {
    throw std::runtime_error("parameter '" + name + "': " + error.what());
  }
}

}  // namespace

int CallCommand(const Target& target, const CallOptions& options) {
  OpenFor({target.folder, "", target.is_json, target.is_quiet});  // the API itself refuses users
  Launcher launcher(WorkerLog::kSyslogOnly);
  Request request{options.api,       options.method, options.version,
                  Json::objectValue, target.user,    SignIn(target.user)};
  for (const std::string& param : options.params) {
    AddParam(param, request.params);
  }
  const Outcome outcome = launcher.Call(request);
  // Odd bytes go out as they are.
  std::cout << ToText(JsonObject({{"code", outcome.code}, {"data", outcome.data}})) << '\n';
  return outcome.code == 0 ? kExitDone : kExitFailed;
}

}  // namespace Device
