#include "device/base/utf8.h"

namespace Device {

std::size_t Utf8SequenceLength(std::string_view text, std::size_t at) {
  const auto byte = [&](std::size_t index) {
    return index < text.size() ? static_cast<unsigned char>(text[index]) : 0U;
  };
  const unsigned first = byte(at);
  if (first < 0x80) {
    return at < text.size() ? 1 : 0;
  }
  const std::size_t length = first < 0xC2 || first > 0xF4 ? 0
                             : first >= 0xF0              ? 4
                             : first >= 0xE0              ? 3
                                                          : 2;
  for (std::size_t index = 1; index < length; ++index) {
    if ((byte(at + index) & 0xC0U) != 0x80U) {
      return 0;
    }
  }
  const unsigned second = byte(at + 1);
  const bool is_overlong = (first == 0xE0 && second < 0xA0) || (first == 0xF0 && second < 0x90);
  const bool is_surrogate = first == 0xED && second >= 0xA0;
  const bool is_too_high = first == 0xF4 && second >= 0x90;
  return is_overlong || is_surrogate || is_too_high ? 0 : length;
}

bool IsUtf8(std::string_view text) {
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t length = Utf8SequenceLength(text, at);
    if (length == 0) {
      return false;
    }
    at += length;
  }
  return true;
}

}  // namespace Device
