// The process of one request that came over HTTP.
#pragma once

#include "device/base/file_descriptor.h"
#include "device/host/launcher.h"

namespace Device {

// Reads the request from the stream, serves it with the identity of the session's user, and answers
// on the stream.
void ServeWebRequest(Launcher& launcher, FileDescriptor exchange);

// What a session tells its user: {"user", "codepage"}.
Json::Value SessionBody(const std::string& user);

// Answers with a frame {"status", "body"}. False when nobody is there to read it.
bool Answer(int exchange, int status, const Json::Value& body);
// The same with a body {"error": reason}.
bool Refuse(int exchange, int status, const std::string& reason);

}  // namespace Device
