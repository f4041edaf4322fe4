#include "device/base/json_text.h"

#include <algorithm>
#include <cstdio>
#include <memory>
#include <stdexcept>

#include "device/base/utf8.h"

namespace Device {

namespace {

constexpr char kHexDigits[] = "0123456789abcdefABCDEF";
constexpr int kHexBase = 16;
constexpr unsigned long kFirstHighSurrogate = 0xD800;
constexpr unsigned long kLastHighSurrogate = 0xDBFF;
constexpr unsigned long kFirstByteEscape = 0xDC80;
constexpr unsigned long kLastByteEscape = 0xDCFF;
constexpr unsigned long kFirstByte = 0x80;

const Json::StreamWriterBuilder& LineWriter() {
  static const Json::StreamWriterBuilder kWriter = [] {
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    writer["commentStyle"] = "None";
    writer["emitUTF8"] = true;  // bytes as they are
    writer["precision"] = 17;   // digits, so that a double reads back as itself
    return writer;
  }();
  return kWriter;
}

[[noreturn]] void Fail(unsigned long line, unsigned long column, const std::string& reason) {
  throw std::runtime_error("line " + std::to_string(line) + ", column " + std::to_string(column) +
                           ": " + reason);
}

// Throws with the first of the library's errors: "* Line 1, Column 8\n  Reason.\n...".
[[noreturn]] void FailFor(const std::string& errors) {
  unsigned long line = 1;
  unsigned long column = 1;
  std::sscanf(errors.c_str(), "* Line %lu, Column %lu", &line, &column);
  const std::size_t begin = std::min(errors.find("\n  ") + 3, errors.size());
  std::string reason = errors.substr(begin, errors.find('\n', begin) - begin);
  reason.resize(reason.find_last_not_of('.') + 1);
  Fail(line, column, reason);
}

// What the library does not refuse with a place, or not at all.
void CheckBytes(const std::string& text, int most_depth) {
  unsigned long line = 1;
  std::size_t line_begin = 0;
  int depth = 0;
  bool is_in_string = false;
  for (std::size_t at = 0; at < text.size(); ++at) {
    const char byte = text[at];
    const unsigned long column = at - line_begin + 1;
    if (byte == '\0') {
      Fail(line, column, "a zero byte");
    } else if (byte == '\n') {
      ++line;
      line_begin = at + 1;
    } else if (byte == '"') {
      is_in_string = !is_in_string;
    } else if (is_in_string) {
      at += byte == '\\' ? 1 : 0;
    } else if ((byte == '[' || byte == '{') && ++depth > most_depth) {
      Fail(line, column, "nested too deep");
    } else if (byte == ']' || byte == '}') {
      --depth;
    }
  }
}

}  // namespace

Json::Value JsonObject(std::initializer_list<std::pair<const char*, Json::Value>> members) {
  Json::Value object(Json::objectValue);
  for (const auto& [name, value] : members) {
    object[name] = value;
  }
  return object;
}

Json::Value JsonArray(const std::vector<std::string>& texts) {
  Json::Value array(Json::arrayValue);
  for (const std::string& text : texts) {
    array.append(text);
  }
  return array;
}

std::string ToText(const Json::Value& value) { return Json::writeString(LineWriter(), value); }

std::string ToUtf8Text(const Json::Value& value) {
  const std::string text = ToText(value);
  std::string safe;
  safe.reserve(text.size());
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t length = Utf8SequenceLength(text, at);
    if (length > 0) {
      safe.append(text, at, length);
      at += length;
      continue;
    }
    const auto byte = static_cast<unsigned char>(text[at++]);
    safe += "\\udc";
    safe += kHexDigits[byte / kHexBase];
    safe += kHexDigits[byte % kHexBase];
  }
  return safe;
}

Json::Value ParseJson(const std::string& text, int depth) {
  CheckBytes(text, depth);
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false;  // a text or a number alone is JSON too
  builder["stackLimit"] = depth + 2;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
    FailFor(errors);
  }
  return value;
}

std::string DecodeByteEscapes(std::string json) {
  constexpr std::size_t kEscape = sizeof "\\udc80" - 1;
  if (json.find("\\u") == std::string::npos) {
    return json;
  }
  const auto code_at = [&](std::size_t at) {
    const bool is_escape = at + kEscape <= json.size() && json[at] == '\\' && json[at + 1] == 'u';
    const std::string digits = is_escape ? json.substr(at + 2, kEscape - 2) : "";
    const bool is_code = is_escape && digits.find_first_not_of(kHexDigits) == std::string::npos;
    return is_code ? std::stoul(digits, nullptr, kHexBase) : 0;
  };
  std::string decoded;
  for (std::size_t at = 0; at < json.size();) {
    const unsigned long code = code_at(at);
    std::size_t length = json[at] == '\\' ? 2 : 1;  // as it stands
    if (code >= kFirstByteEscape && code <= kLastByteEscape) {
      decoded += static_cast<char>(code - kFirstByteEscape + kFirstByte);
      at += kEscape;
      continue;
    }
    if (code >= kFirstHighSurrogate && code <= kLastHighSurrogate) {
      length = 2 * kEscape;  // with the other half of the pair
    }
    decoded.append(json, at, length);
    at += length;
  }
  return decoded;
}

}  // namespace Device
