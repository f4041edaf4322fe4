// Files on their way to a client.
#pragma once

#include <string>

namespace Device {

// Answers on the stream with what HTTP says of a user's file, then with a message, the file's
// descriptor and the user's name: it is the front end that sends the file, and takes its time. To
// be called with the user's identity. Throws Refused.
void SendFile(int stream, const std::string& user, const std::string& path);

}  // namespace Device
