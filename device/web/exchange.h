// One exchange of the front end with the launcher.
#pragma once

#include <json/json.h>

#include <optional>
#include <string>

#include "device/base/file_descriptor.h"
#include "device/host/wire.h"

namespace Web {

class Exchange {
 public:
  // Tells the launcher. Where that fails, no frame will come.
  Exchange(Device::ControlKind kind, const std::string& text);
  // Tells the launcher to have the request served, and sends it.
  explicit Exchange(const Json::Value& request);

  // The answer; the status 500 when the other side went without one.
  Device::Answer Receive();
  // The next of the events that follow the answer, as the client gets it. Nothing at their end.
  std::optional<std::string> Next();
  // Waits for the next frame. False after the time-out.
  bool Wait(int milliseconds) const;

 private:
  Device::FileDescriptor stream_;
};

}  // namespace Web
