#include "device/host/wire.h"

#include <sstream>

#include "device/base/file_io.h"
#include "device/base/json_text.h"

namespace Device {

Answer::Answer(int http_status, const Json::Value& json)
    : Answer(http_status, json.isNull() ? "" : ToUtf8Text(json)) {}

Answer::Answer(int http_status, std::string json_text)
    : status(http_status), body(std::move(json_text)) {
  body += body.empty() ? "" : "\n";
}

Answer Refusal(int status, const std::string& reason, const std::string& retry_seconds) {
  Answer answer(status, JsonObject({{"error", reason}}));
  if (!retry_seconds.empty()) {
    answer.headers = {{"Retry-After", retry_seconds}};
  }
  return answer;
}

bool SendAnswer(int stream, const Answer& answer) {
  std::string head = std::to_string(answer.status) + "\n";
  for (const auto& [name, value] : answer.headers) {
    head.append(name).append(": ").append(value).append("\n");
  }
  return WriteFrame(stream, head) && WriteFrame(stream, answer.body);
}

std::optional<Answer> ReceiveAnswerHead(int stream) {
  const std::optional<std::string> text = ReadFrame(stream);
  if (!text || text->empty()) {
    return std::nullopt;
  }
  std::istringstream head(*text);
  std::string line;
  std::getline(head, line);
  Answer answer(std::stoi(line));
  while (std::getline(head, line)) {
    const std::size_t colon = line.find(": ");
    answer.headers.emplace_back(line.substr(0, colon), line.substr(colon + 2));
  }
  return answer;
}

}  // namespace Device
