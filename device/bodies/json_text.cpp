#include "device/bodies/json_text.h"

#include <memory>
#include <stdexcept>

namespace Device {

namespace {

constexpr char kHexDigits[] = "0123456789abcdefABCDEF";
constexpr int kHexBase = 16;
constexpr unsigned long kFirstHighSurrogate = 0xD800;
constexpr unsigned long kLastHighSurrogate = 0xDBFF;
constexpr unsigned long kFirstByteEscape = 0xDC80;
constexpr unsigned long kLastByteEscape = 0xDCFF;
constexpr unsigned long kFirstByte = 0x80;

// The parser says "* Line 4, Column 1\n  Missing ...\n", once for each error. No regular
// expression: what is missing may be quoted at any length.
std::string FirstError(const std::string& errors) {
  const std::size_t line = errors.find_first_of("0123456789");
  const std::size_t column = errors.find_first_of("0123456789", errors.find(','));
  const std::size_t end = errors.find('\n');
  const std::size_t reason = errors.find_first_not_of(' ', end + 1);
  return "line " + errors.substr(line, errors.find(',') - line) + ", column " +
         errors.substr(column, end - column) + ": " +
         errors.substr(reason, errors.find('\n', reason) - reason);
}

// Where so many arrays and objects are open for the first time.
std::size_t LineOfDepth(const std::string& text, int depth) {
  std::size_t line = 1;
  bool is_quoted = false;
  for (std::size_t at = 0; at < text.size() && depth > 0; ++at) {
    const char each = text[at];
    line += each == '\n' ? 1 : 0;
    if (each == '"') {
      is_quoted = !is_quoted;
    } else if (is_quoted) {
      at += each == '\\' ? 1 : 0;
    } else if (each == '[' || each == '{') {
      --depth;
    } else if (each == ']' || each == '}') {
      ++depth;
    }
  }
  return line;
}

}  // namespace

std::string ToText(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

Json::Value ParseJson(const std::string& text, int depth) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false;
  builder["stackLimit"] = depth;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  bool is_parsed = false;
  try {
    is_parsed = reader->parse(text.data(), text.data() + text.size(), &value, &errors);
  } catch (const Json::Exception&) {
    throw std::runtime_error("line " + std::to_string(LineOfDepth(text, depth)) +
                             ": nested too deep");
  }
  if (!is_parsed) {
    throw std::runtime_error(FirstError(errors));
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
