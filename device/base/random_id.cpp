#include "device/base/random_id.h"

#include <sys/random.h>

#include <cerrno>
#include <cstdint>
#include <system_error>
#include <vector>

namespace Device {

std::string RandomId(std::size_t bytes) {
  std::vector<std::uint8_t> random(bytes);
  if (getrandom(random.data(), random.size(), 0) != static_cast<ssize_t>(random.size())) {
    throw std::system_error(errno, std::generic_category(), "random bytes");
  }
  constexpr char kDigits[] = "0123456789ABCDEF";
  constexpr unsigned kHalfByte = 4;
  std::string id;
  for (const std::uint8_t byte : random) {
    id += kDigits[byte >> kHalfByte];
    id += kDigits[byte & 0xFU];
  }
  return id;
}

}  // namespace Device
