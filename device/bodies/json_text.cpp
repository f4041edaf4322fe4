#include "device/bodies/json_text.h"

#include <memory>
#include <regex>
#include <stdexcept>

namespace Device {

std::string ToText(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

Json::Value ParseJson(const std::string& text) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["strictRoot"] = false;
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
    // The parser says "* Line 4, Column 1\n  Missing ...\n", once for each error.
    static const std::regex kFirstError(R"(\* Line (\d+), Column \d+\s+([^\n]*)[^]*)");
    throw std::runtime_error(std::regex_replace(errors, kFirstError, "line $1: $2"));
  }
  return value;
}

}  // namespace Device
