#include "device/web/exchange.h"

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <iterator>

#include "device/base/json_text.h"
#include "device/web/connection.h"

namespace Web {

namespace {

constexpr int kControl = STDIN_FILENO;  // the launcher has put its socket there

}  // namespace

Exchange::Exchange(const Json::Value& asked) {
  Connection::OfThisThread().EndReading();
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    return;
  }
  stream_ = Device::FileDescriptor(ends[0]);
  const Device::FileDescriptor other_side(ends[1]);
  Device::SendMessage(kControl, Device::ToText(asked), other_side.Get());
}

Device::Answer Exchange::Receive() {
  pollfd sources[] = {{stream_.Get(), POLLIN, 0},
                      {Connection::OfThisThread().socket(), POLLRDHUP, 0}};
  while (stream_ && poll(sources, std::size(sources), -1) < 0) {
  }
  if (sources[0].revents == 0) {
    stream_.Close();  // the client has gone, which the other side sees by this
  }
  const std::optional<Device::Answer> answer = Device::ReceiveAnswerHead(stream_.Get());
  const std::optional<std::size_t> length = Device::ReadFrameLength(stream_.Get());
  body_left_ = length.value_or(0);
  return answer && length
             ? *answer
             : Device::Refusal(Device::kHttpInternal, "the request ended without an answer");
}

std::optional<std::string> Exchange::Next() { return Device::ReadFrame(stream_.Get()); }

std::optional<Device::SocketMessage> Exchange::ReceiveFile() {
  constexpr std::size_t kMostNameBytes = 256;
  return Device::ReceiveMessage(stream_.Get(), kMostNameBytes);
}

bool Exchange::Wait(int milliseconds) const {
  pollfd source = {stream_.Get(), POLLIN, 0};
  return poll(&source, 1, milliseconds) != 0;
}

}  // namespace Web
