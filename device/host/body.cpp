#include "device/host/body.h"

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <stdexcept>
#include <utility>

#include "device/base/json_text.h"

namespace Device {

namespace {

constexpr char kFormType[] = "application/x-www-form-urlencoded";

// Throws std::runtime_error for a "%" without two digits.
std::string UnquoteField(const std::string& text, std::size_t place) {
  std::string plain;
  plain.reserve(text.size());
  for (std::size_t at = 0; at < text.size(); ++at) {
    if (text[at] != '%') {
      plain += text[at] == '+' ? ' ' : text[at];
      continue;
    }
    unsigned char byte = 0;
    const char* const digits = text.data() + at + 1;
    const char* const end = digits + std::min<std::size_t>(2, text.size() - at - 1);
    if (end - digits < 2 || std::from_chars(digits, end, byte, 16).ptr != end) {
      throw std::runtime_error("body: byte " + std::to_string(place + at + 1) +
                               ": '%' without two digits");
    }
    plain += static_cast<char>(byte);
    at += 2;
  }
  return plain;
}

Json::Value ParseForm(const std::string& body) {
  Json::Value form(Json::objectValue);
  for (std::size_t begin = 0; begin < body.size();) {
    const std::size_t end = std::min(body.find('&', begin), body.size());
    const std::string field = body.substr(begin, end - begin);
    const std::size_t equals = std::min(field.find('='), field.size());
    const std::string name = UnquoteField(field.substr(0, equals), begin);
    const std::size_t value = std::min(begin + equals + 1, end);
    if (form.isMember(name)) {
      throw std::runtime_error("body: field '" + name + "' stands there twice");
    }
    form[name] = UnquoteField(body.substr(value, end - value), value);
    begin = end + 1;
  }
  return form;
}

int VersionOf(const Json::Value& field) {
  if (field.isInt()) {
    return field.asInt();
  }
  const std::string text = field.isString() ? field.asString() : "";
  const long number = std::strtol(text.c_str(), nullptr, 10);
  if (text.find_first_not_of("0123456789") != std::string::npos || text.empty() || number > 1000) {
    throw std::runtime_error("'version' is missing or not a number");
  }
  return static_cast<int>(number);
}

}  // namespace

Json::Value ParseBody(const std::string& content_type, std::string body) {
  if (content_type.compare(0, sizeof kFormType - 1, kFormType) == 0) {
    return ParseForm(body);
  }
  Json::Value value;
  try {
    value = ParseJson(DecodeByteEscapes(std::move(body)), kParamDepth, kMostValues);
  } catch (const std::runtime_error& error) {
    throw std::runtime_error(std::string("body: ") + error.what());
  }
  if (!value.isObject()) {
    throw std::runtime_error("body: not an object");
  }
  return value;
}

Json::Value ApiRequest(Json::Value body) {
  Json::Value request = JsonObject({{"api", TextField(body, "api")},
                                    {"method", TextField(body, "method")},
                                    {"version", VersionOf(body["version"])}});
  Json::Value& params = request["params"];
  if (!body.removeMember("params", &params)) {
    params.swap(body);
    for (const char* name : {"api", "method", "version"}) {
      params.removeMember(name);
    }
  }
  if (!params.isObject()) {
    throw std::runtime_error("'params' is not an object");
  }
  return request;
}

std::string TextField(const Json::Value& body, const std::string& name) {
  if (!body[name].isString()) {
    throw std::runtime_error("'" + name + "' is missing or no text");
  }
  return body[name].asString();
}

}  // namespace Device
