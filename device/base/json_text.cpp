#include "device/base/json_text.h"

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <memory>
#include <stdexcept>

#include "device/base/shortage.h"
#include "device/base/utf8.h"

namespace Device {

namespace {

constexpr int kHexBase = 16;

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
void CheckBytes(const std::string& text, int most_depth, std::size_t most_values) {
  unsigned long line = 1;
  std::size_t line_begin = 0;
  std::size_t values = 1;
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
    } else if ((byte == ',' || byte == '[' || byte == '{') && ++values > most_values) {
      ThrowMemoryShortage();
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
    char escape[sizeof "\\udc80"];
    std::snprintf(escape, sizeof escape, "\\udc%02x", static_cast<unsigned char>(text[at++]));
    safe += escape;
  }
  return safe;
}

Json::Value ParseJson(const std::string& text, int depth, std::size_t most_values) {
  CheckBytes(text, depth, most_values);
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false;  // a text or a number alone is JSON too
  builder["stackLimit"] = depth + 2;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  try {
    if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
      FailFor(errors);
    }
  } catch (const Json::RuntimeError&) {  // what the library says when it has no memory
    ThrowMemoryShortage();
  }
  return value;
}

std::string DecodeByteEscapes(std::string json) {
  constexpr std::size_t kDigits = 4;
  constexpr std::size_t kEscape = 2 + kDigits;  // "\\udc80"
  std::size_t decoded = 0;                      // bytes, in place
  for (std::size_t at = 0; at < json.size();) {
    std::size_t length = json[at] == '\\' ? 2 : 1;  // as it stands
    if (json.compare(at, 2, "\\u") == 0 && at + kEscape <= json.size()) {
      const char* const digits = json.data() + at + 2;
      unsigned code = 0;
      const auto [end, error] = std::from_chars(digits, digits + kDigits, code, kHexBase);
      if (end == digits + kDigits && code >= 0xDC80 && code <= 0xDCFF) {
        json[decoded++] = static_cast<char>(code - 0xDC00);
        at += kEscape;
        continue;
      }
      length = code >= 0xD800 && code <= 0xDBFF ? 2 * kEscape : kEscape;  // a pair stays together
    }
    for (; length > 0 && at < json.size(); --length) {
      json[decoded++] = json[at++];
    }
  }
  json.resize(decoded);
  return json;
}

}  // namespace Device
