// Going on where something fails that the caller can do without.
#pragma once

#include <syslog.h>

#include <exception>

namespace Device {

// Runs the body. False when it throws; what it says is logged under the operation's name.
template <typename Body>
bool TryOrLog(const char* operation, Body body) {
  try {
    body();
    return true;
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "%s: %s", operation, error.what());
    return false;
  }
}

}  // namespace Device
