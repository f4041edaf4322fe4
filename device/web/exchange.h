// One exchange of the front end with the launcher.
#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "device/base/file_descriptor.h"
#include "device/base/file_io.h"
#include "device/base/socket_message.h"
#include "device/host/wire.h"

namespace Web {

class Exchange {
 public:
  // Tells the launcher, once the head has been read, and of a sign-in the body. Where that fails,
  // no frame will come.
  explicit Exchange(const Json::Value& asked);

  // Sends a part of the body; an empty one ends it. What nobody reads any more is dropped.
  void Send(const std::string& part) { Device::WriteFrame(stream_.Get(), part); }

  // The answer, whose body, of so many bytes, is then to be read; the status 500, with a body, when
  // the other side went without one.
  Device::Answer Receive();
  std::size_t BodyLeft() const { return body_left_; }
  // False when the other side is gone.
  bool ReadBody(char* to, std::size_t size) {
    body_left_ -= size;
    return Device::ReadAll(stream_.Get(), to, size);
  }
  // The next of the events that follow the answer, as the client gets it. Nothing at their end.
  std::optional<std::string> Next();
  // The file that follows an answer about it, and its user's name; nothing when none does.
  std::optional<Device::SocketMessage> ReceiveFile();
  // Waits for the next frame. False after the time-out.
  bool Wait(int milliseconds) const;

 private:
  Device::FileDescriptor stream_;
  std::size_t body_left_ = 0;
};

}  // namespace Web
