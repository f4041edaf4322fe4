// The process of one request that came over HTTP.
#pragma once

#include <json/json.h>

#include <string>

#include "device/base/file_descriptor.h"
#include "device/host/launcher.h"

namespace Device {

// Reads the request from the stream, serves it with the identity of the session's user, and answers
// on the stream.
void ServeWebRequest(Launcher& launcher, FileDescriptor stream);

// What a session tells its user: {"user", "codepage"}.
Json::Value SessionBody(const std::string& user);

}  // namespace Device
