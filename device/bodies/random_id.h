// Identifiers that cannot be guessed.
#ifndef DEVICE_BODIES_RANDOM_ID_H_
#define DEVICE_BODIES_RANDOM_ID_H_

#include <string>

namespace Device {

// `bytes` random bytes as hexadecimal digits. Throws std::system_error.
std::string RandomId(std::size_t bytes);

}  // namespace Device

#endif  // DEVICE_BODIES_RANDOM_ID_H_
