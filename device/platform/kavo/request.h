// A request and its outcome, and what is behind the objects by which a module sees them.
#pragma once

#include <json/json.h>

#include <string>

#include "platform/kavo/api_host.h"

namespace Device {

struct Request {
  std::string api;
  std::string method;
  int version = 0;
  Json::Value params{Json::objectValue};
  std::string user;
  std::string session_id;
  bool is_followed = false;  // the client watches the task to its end: no desktop notification
};

struct Outcome {
  int code = 0;  // a KAVO::ErrorCode; 0: success
  Json::Value data;
};

}  // namespace Device

struct KAVO::APIRequest::State {
  const Device::Request& request;
};

struct KAVO::APIResponse::State {
  Device::Outcome outcome;
};
