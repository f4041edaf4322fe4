// The stream of what happens to a user's tasks.
#pragma once

#include <json/json.h>

#include <string>

#include "device/tasks/task_store.h"

namespace Device {

// "time" (seconds since 1970), "taskid", "title", "message" (a key), "arguments" (HTML-encoded).
Json::Value NotificationView(const NotificationRow& row);

// Writes a frame with a server-sent event for each task there is, then for each change, until the
// session ends or nobody reads from the stream. To be called with the user's identity. Throws
// std::runtime_error when the store cannot be read.
void SendTaskEvents(int stream, const std::string& user, const std::string& session_id);

}  // namespace Device
