#include "device/host/control.h"

#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstring>

namespace Device {

namespace {

// Room for one descriptor beside a message.
union Ancillary {
  cmsghdr header;
  std::array<char, CMSG_SPACE(sizeof(int))> bytes;
};

}  // namespace

bool SendControl(int socket, ControlKind kind, const std::string& text, int exchange) {
  std::string bytes = static_cast<char>(kind) + text;
  iovec part = {bytes.data(), bytes.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  Ancillary ancillary{};
  if (exchange >= 0) {
    message.msg_control = &ancillary;
    message.msg_controllen = sizeof ancillary;
    ancillary.header.cmsg_level = SOL_SOCKET;
    ancillary.header.cmsg_type = SCM_RIGHTS;
    ancillary.header.cmsg_len = CMSG_LEN(sizeof exchange);
    std::memcpy(CMSG_DATA(&ancillary.header), &exchange, sizeof exchange);
  }
  ssize_t sent = 0;
  do {
    sent = sendmsg(socket, &message, MSG_NOSIGNAL);
  } while (sent < 0 && errno == EINTR);
  return sent >= 0;
}

std::optional<ControlMessage> ReceiveControl(int socket) {
  std::string bytes(1 + kMostControlBytes, '\0');
  iovec part = {bytes.data(), bytes.size()};
  Ancillary ancillary{};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = &ancillary;
  message.msg_controllen = CMSG_LEN(sizeof(int));  // rounded up there would be room for two
  ssize_t got = 0;
  do {
    got = recvmsg(socket, &message, MSG_CMSG_CLOEXEC);
  } while (got < 0 && errno == EINTR);
  if (got < 1) {
    return std::nullopt;
  }
  ControlMessage received;
  received.kind = static_cast<ControlKind>(bytes.front());
  received.text = bytes.substr(1, static_cast<std::size_t>(got) - 1);
  if (const cmsghdr* const header = CMSG_FIRSTHDR(&message);
      header != nullptr && header->cmsg_type == SCM_RIGHTS) {
    int exchange = -1;
    std::memcpy(&exchange, CMSG_DATA(header), sizeof exchange);
    received.exchange = FileDescriptor(exchange);
  }
  return received;
}

}  // namespace Device
