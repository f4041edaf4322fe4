#include "device/base/file_io.h"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <filesystem>

namespace Device {

void OccupyStandardStreams() {
  int fd = 0;
  do {
    fd = open("/dev/null", O_RDWR);
  } while (fd >= 0 && fd <= STDERR_FILENO);
  close(fd);
}

FileDescriptor OpenBesideProgram(const std::string& name, int flags) {
  const std::filesystem::path path =
      std::filesystem::read_symlink("/proc/self/exe").parent_path() / name;
  FileDescriptor file(open(path.c_str(), flags | O_CLOEXEC));
  if (!file) {
    ThrowErrno(path.string());
  }
  return file;
}

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
    ThrowErrno(path);
  }
  return text;
}

bool WriteAll(int fd, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = TEMP_FAILURE_RETRY(write(fd, bytes.data(), bytes.size()));
    if (written < 0) {
      return false;
    }
    bytes.remove_prefix(static_cast<std::size_t>(written));
  }
  return true;
}

bool ReadAll(int fd, char* to, std::size_t size) {
  while (size > 0) {
    const ssize_t got = TEMP_FAILURE_RETRY(read(fd, to, size));
    if (got <= 0) {
      return false;
    }
    to += got;
    size -= static_cast<std::size_t>(got);
  }
  return true;
}

bool WriteFrame(int fd, const std::string& text) {
  const auto length = static_cast<std::uint32_t>(text.size());
  return WriteAll(fd, {reinterpret_cast<const char*>(&length), sizeof length}) &&
         WriteAll(fd, text);
}

std::optional<std::size_t> ReadFrameLength(int fd) {
  std::uint32_t length = 0;
  return ReadAll(fd, reinterpret_cast<char*>(&length), sizeof length) && length <= kMostFrameBytes
             ? std::optional<std::size_t>(length)
             : std::nullopt;
}

std::optional<std::string> ReadFrame(int fd) {
  const std::optional<std::size_t> length = ReadFrameLength(fd);
  std::string text(length.value_or(0), '\0');
  return length && ReadAll(fd, text.data(), text.size()) ? std::optional(std::move(text))
                                                         : std::nullopt;
}

}  // namespace Device
