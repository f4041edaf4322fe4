// What is behind the host's request and response objects.
#ifndef DEVICE_HOST_REQUEST_STATE_H_
#define DEVICE_HOST_REQUEST_STATE_H_

#include "device/host/launcher.h"
#include "platform/kavo/api_host.h"

struct KAVO::APIRequest::State {
  const Device::Request& request;
};

struct KAVO::APIResponse::State {
  Device::Outcome outcome;
};

#endif  // DEVICE_HOST_REQUEST_STATE_H_
