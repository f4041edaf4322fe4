// Sends files that request processes have opened.
#pragma once

#include <httplib.h>

#include "device/base/socket_message.h"
#include "device/host/wire.h"

namespace Web {

// Sends the file, or of it the range that is asked for; `message` has the file, and its user's
// name. Refused when the user has too many downloads already.
void SendFile(const httplib::Request& request, httplib::Response& response,
              const Device::Answer& answer, Device::SocketMessage message);

}  // namespace Web
