#include "device/base/socket_message.h"

#include <sys/socket.h>

#include <array>
#include <cstring>

namespace Device {

namespace {

// Room for one descriptor beside a message.
union Ancillary {
  cmsghdr header;
  std::array<char, CMSG_SPACE(sizeof(int))> bytes;
};

}  // namespace

bool SendMessage(int socket, std::string bytes, int descriptor) {
  iovec part = {bytes.data(), bytes.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  Ancillary ancillary{};
  if (descriptor >= 0) {
    message.msg_control = &ancillary;
    message.msg_controllen = sizeof ancillary;
    ancillary.header.cmsg_level = SOL_SOCKET;
    ancillary.header.cmsg_type = SCM_RIGHTS;
    ancillary.header.cmsg_len = CMSG_LEN(sizeof descriptor);
    std::memcpy(CMSG_DATA(&ancillary.header), &descriptor, sizeof descriptor);
  }
  return TEMP_FAILURE_RETRY(sendmsg(socket, &message, MSG_NOSIGNAL)) >= 0;
}

std::optional<SocketMessage> ReceiveMessage(int socket, std::size_t most) {
  SocketMessage received;
  received.bytes.resize(most);
  iovec part = {received.bytes.data(), most};
  Ancillary ancillary{};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = &ancillary;
  message.msg_controllen = CMSG_LEN(sizeof(int));  // rounded up there would be room for two
  const ssize_t got = TEMP_FAILURE_RETRY(recvmsg(socket, &message, MSG_CMSG_CLOEXEC));
  if (got < 1) {
    return std::nullopt;
  }
  received.bytes.resize(static_cast<std::size_t>(got));
  if (const cmsghdr* const header = CMSG_FIRSTHDR(&message);
      header != nullptr && header->cmsg_type == SCM_RIGHTS) {
    int descriptor = -1;
    std::memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
    received.descriptor = FileDescriptor(descriptor);
  }
  return received;
}

}  // namespace Device
