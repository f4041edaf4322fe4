// A message on a socket, with a descriptor beside it.
#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "device/base/file_descriptor.h"

namespace Device {

struct SocketMessage {
  std::string bytes;
  FileDescriptor descriptor;  // invalid: none came
};

// False when the other side is gone. The descriptor stays the caller's; -1 for none.
bool SendMessage(int socket, std::string bytes, int descriptor);

// Nothing when the other side is gone. A message is one byte long at least, and `most` at the most.
std::optional<SocketMessage> ReceiveMessage(int socket, std::size_t most);

}  // namespace Device
