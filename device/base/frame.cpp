#include "device/base/frame.h"

#include <cstdint>

#include "device/base/file_io.h"

namespace Device {

bool WriteFrame(int fd, const std::string& text) {
  const auto length = static_cast<std::uint32_t>(text.size());
  return WriteAll(fd, std::string(reinterpret_cast<const char*>(&length), sizeof length) + text);
}

std::optional<std::string> ReadFrame(int fd) {
  std::uint32_t length = 0;
  if (!ReadAll(fd, reinterpret_cast<char*>(&length), sizeof length) || length > kMostFrameBytes) {
    return std::nullopt;
  }
  std::string text(length, '\0');
  return ReadAll(fd, text.data(), text.size()) ? std::optional(std::move(text)) : std::nullopt;
}

}  // namespace Device
