// The process of one request that came over HTTP.
#pragma once

#include <json/json.h>

#include <string>

#include "device/base/file_descriptor.h"
#include "device/host/launcher.h"

namespace Device {

// Serves a request (wire.h), with its body from the stream, with the identity of the session's
// user, and answers on the stream. What takes too much memory or finds the user's store locked is
// refused.
void ServeWebRequest(Launcher& launcher, FileDescriptor stream, const Json::Value& asked);

// What a session tells its user: {"user", "codepage"}.
Json::Value SessionBody(const std::string& user);

}  // namespace Device
