// The bodies of HTTP requests. No I/O.
#pragma once

#include <json/json.h>

#include <string>

namespace Device {

// The object that a body holds: JSON, or a form, whose fields become texts. Throws
// std::runtime_error with the place and the reason, std::bad_alloc when it holds too much.
Json::Value ParseBody(const std::string& content_type, std::string body);

// A request of the API: its "api", "version", "method" and "params". Where there are no "params",
// as in a form, every field but "api", "version" and "method" is a parameter. Throws
// std::runtime_error that names the field.
Json::Value ApiRequest(Json::Value body);

// A text field. Throws std::runtime_error that names it when it is missing or none.
std::string TextField(const Json::Value& body, const std::string& name);

}  // namespace Device
