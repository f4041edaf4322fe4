#include "device/base/frame.h"

#include <unistd.h>

#include <cerrno>
#include <cstdint>

namespace Device {

namespace {

bool WriteAll(int fd, const char* from, std::size_t size) {
  for (std::size_t at = 0; at < size;) {
    const ssize_t written = write(fd, from + at, size - at);
    if (written < 0 && errno != EINTR) {
      return false;
    }
    at += written < 0 ? 0 : static_cast<std::size_t>(written);
  }
  return true;
}

bool ReadAll(int fd, char* to, std::size_t size) {
  for (std::size_t at = 0; at < size;) {
    const ssize_t got = read(fd, to + at, size - at);
    if (got == 0 || (got < 0 && errno != EINTR)) {
      return false;
    }
    at += got < 0 ? 0 : static_cast<std::size_t>(got);
  }
  return true;
}

}  // namespace

bool WriteFrame(int fd, const std::string& text) {
  const auto length = static_cast<std::uint32_t>(text.size());
  std::string bytes(reinterpret_cast<const char*>(&length), sizeof length);
  bytes += text;
  return WriteAll(fd, bytes.data(), bytes.size());
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
