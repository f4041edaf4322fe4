// The identity that a process has taken on.
#pragma once

#include <string>

namespace Device {

// What LumoLibUGIDSet does, for the device itself: no trace shows it, and no fault answers for it.
int SwitchTo(const char* session_id, const char* user);

// The user whose identity this process has; empty: the device's own.
const std::string& CurrentUser();

}  // namespace Device
