// The stream of what happens to a user's tasks.
#pragma once

#include <string>

namespace Device {

// Writes a frame with a server-sent event for each task there is, then for each change, until the
// session ends or nobody reads from the stream. To be called with the user's identity. Throws
// std::runtime_error when the store cannot be read.
void SendTaskEvents(int stream, const std::string& user, const std::string& session_id);

}  // namespace Device
