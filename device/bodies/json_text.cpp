#include "device/bodies/json_text.h"

#include <memory>
#include <stdexcept>

namespace Device {

namespace {

// The parser says "* Line 4, Column 1\n  Missing ...\n", once for each error. No regular
// expression: what is missing may be quoted at any length.
std::string FirstError(const std::string& errors) {
  const std::size_t line = errors.find_first_of("0123456789");
  const std::size_t reason = errors.find_first_not_of(' ', errors.find('\n') + 1);
  return "line " + errors.substr(line, errors.find(',') - line) + ": " +
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

}  // namespace Device
