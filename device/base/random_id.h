// Identifiers that cannot be guessed.
#pragma once

#include <string>

namespace Device {

// `bytes` random bytes as hexadecimal digits. Throws std::system_error.
std::string RandomId(std::size_t bytes);

}  // namespace Device
