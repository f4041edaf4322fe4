#include "device/host/wire.h"

#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <sstream>

#include "device/base/file_io.h"
#include "device/base/json_text.h"

namespace Device {

namespace {

// Room for one descriptor beside a message.
union Ancillary {
  cmsghdr header;
  std::array<char, CMSG_SPACE(sizeof(int))> bytes;
};

}  // namespace

bool SendControl(int socket, ControlKind kind, const std::string& text, int stream) {
  std::string bytes = static_cast<char>(kind) + text;
  iovec part = {bytes.data(), bytes.size()};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  Ancillary ancillary{};
  if (stream >= 0) {
    message.msg_control = &ancillary;
    message.msg_controllen = sizeof ancillary;
    ancillary.header.cmsg_level = SOL_SOCKET;
    ancillary.header.cmsg_type = SCM_RIGHTS;
    ancillary.header.cmsg_len = CMSG_LEN(sizeof stream);
    std::memcpy(CMSG_DATA(&ancillary.header), &stream, sizeof stream);
  }
  return TEMP_FAILURE_RETRY(sendmsg(socket, &message, MSG_NOSIGNAL)) >= 0;
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
  const ssize_t got = TEMP_FAILURE_RETRY(recvmsg(socket, &message, MSG_CMSG_CLOEXEC));
  if (got < 1) {
    return std::nullopt;
  }
  ControlMessage received;
  received.kind = static_cast<ControlKind>(bytes.front());
  received.text = bytes.substr(1, static_cast<std::size_t>(got) - 1);
  if (const cmsghdr* const header = CMSG_FIRSTHDR(&message);
      header != nullptr && header->cmsg_type == SCM_RIGHTS) {
    int stream = -1;
    std::memcpy(&stream, CMSG_DATA(header), sizeof stream);
    received.stream = FileDescriptor(stream);
  }
  return received;
}

Answer::Answer(int http_status, const Json::Value& json)
    : status(http_status), body(json.isNull() ? "" : ToUtf8Text(json) + "\n") {}

Answer Refusal(int status, const std::string& reason) {
  return Answer(status, JsonObject({{"error", reason}}));
}

bool SendAnswer(int stream, const Answer& answer) {
  std::string text = std::to_string(answer.status) + "\n";
  for (const auto& [name, value] : answer.headers) {
    text.append(name).append(": ").append(value).append("\n");
  }
  return WriteFrame(stream, text + "\n" + answer.body);
}

std::optional<Answer> ReceiveAnswer(int stream) {
  const std::optional<std::string> text = ReadFrame(stream);
  const std::size_t head_end = text ? text->find("\n\n") : std::string::npos;
  if (head_end == std::string::npos) {
    return std::nullopt;
  }
  std::istringstream head(text->substr(0, head_end + 1));
  std::string line;
  std::getline(head, line);
  Answer answer(std::stoi(line));
  while (std::getline(head, line)) {
    const std::size_t colon = line.find(": ");
    answer.headers.emplace_back(line.substr(0, colon), line.substr(colon + 2));
  }
  answer.body = text->substr(head_end + 2);
  return answer;
}

}  // namespace Device
