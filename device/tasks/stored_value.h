// A property of a task as the store has it: texts of JSON, of an object one for each member. A job
// of many sources has large ones, so values are made of them only when they are asked for.
#pragma once

#include <json/json.h>

#include <map>
#include <string>

namespace Device {

struct StoredValue {
  StoredValue() = default;
  StoredValue(const Json::Value& value);  // NOLINT(google-explicit-constructor): as texts

  bool IsObject() const;
  bool IsNull() const;
  bool HasMember(const std::string& name) const { return members.count(name) != 0; }

  // The value; what is damaged in the store is null.
  Json::Value Value() const;
  // Null when there is none of that name.
  Json::Value Member(const std::string& name) const;

  std::string text = "null";                   // of an object "{}"
  std::map<std::string, std::string> members;  // of an object, by name
};

}  // namespace Device
