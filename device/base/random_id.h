// Identifiers that cannot be guessed.
#pragma once

#include <cstdio>
#include <random>
#include <string>

namespace Device {

// So many random words of 32 bits as hexadecimal digits. Throws std::exception when the system has
// no random numbers.
inline std::string RandomId(int words) {
  std::random_device random;
  std::string id;
  for (; words > 0; --words) {
    char digits[sizeof "01234567"];
    std::snprintf(digits, sizeof digits, "%08X", random());
    id += digits;
  }
  return id;
}

}  // namespace Device
