#include "device/base/text_file.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <stdexcept>

#include "device/base/file_descriptor.h"

namespace Device {

std::string ReadTextFile(const std::string& path) {
  const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  std::string text;
  std::array<char, 65536> block{};
  ssize_t got = file ? 1 : -1;
  while (got > 0) {
    got = read(file.Get(), block.data(), block.size());
    text.append(block.data(), got > 0 ? static_cast<std::size_t>(got) : 0);
  }
  if (got < 0) {
    throw std::runtime_error(path + ": " + std::strerror(errno));
  }
  return text;
}

}  // namespace Device
