// What is behind the host's request and response objects.
#pragma once

#include "device/host/launcher.h"
#include "platform/kavo/api_host.h"

struct KAVO::APIRequest::State {
  const Device::Request& request;
};

struct KAVO::APIResponse::State {
  Device::Outcome outcome;
};
