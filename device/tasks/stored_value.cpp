#include "device/tasks/stored_value.h"

#include <syslog.h>

#include <stdexcept>

#include "device/base/json_text.h"

namespace Device {

namespace {

constexpr char kObject[] = "{}";
constexpr char kNull[] = "null";

Json::Value Parse(const std::string& text) {
  try {
    return ParseJson(text);
  } catch (const std::runtime_error& error) {
    syslog(LOG_ERR, "task store: damaged value: %s", error.what());
    return {};
  }
}

}  // namespace

StoredValue::StoredValue(const Json::Value& value)
    : text(value.isObject() ? kObject : ToText(value)) {
  for (auto member = value.begin(); value.isObject() && member != value.end(); ++member) {
    members.emplace(member.name(), ToText(*member));
  }
}

bool StoredValue::IsObject() const { return text == kObject; }

bool StoredValue::IsNull() const { return text == kNull; }

Json::Value StoredValue::Value() const {
  Json::Value value = Parse(text);
  if (!IsObject()) {
    return value;
  }
  for (const auto& [name, member] : members) {
    value[name] = Parse(member);
  }
  return value;
}

Json::Value StoredValue::Member(const std::string& name) const {
  const auto found = members.find(name);
  return found == members.end() ? Json::Value() : Parse(found->second);
}

}  // namespace Device
