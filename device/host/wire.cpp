#include "device/host/wire.h"

#include <sstream>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/base/socket_message.h"

namespace Device {

bool SendControl(int socket, ControlKind kind, const std::string& text, int stream) {
  return SendMessage(socket, static_cast<char>(kind) + text, stream);
}

std::optional<ControlMessage> ReceiveControl(int socket) {
  std::optional<SocketMessage> message = ReceiveMessage(socket, 1 + kMostControlBytes);
  if (!message) {
    return std::nullopt;
  }
  return ControlMessage{static_cast<ControlKind>(message->bytes.front()), message->bytes.substr(1),
                        std::move(message->descriptor)};
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
