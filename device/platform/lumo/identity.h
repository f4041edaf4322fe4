// The identity that a process has taken on.
#pragma once

#include <string>

namespace Device {

// The user whose identity this process has; empty: the device's own.
const std::string& CurrentUser();

}  // namespace Device
