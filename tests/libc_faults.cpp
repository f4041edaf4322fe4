// The program's own bodies of libc calls come before libc's, for the module too.
#include "tests/libc_faults.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <filesystem>
#include <fstream>

namespace {

LibcFault armed;
int log_file = -1;
std::string made_path;

bool Hits(const char* call, const std::string& argument) {
  if (armed.call != call || argument.find(armed.part) == std::string::npos) {
    return false;
  }
  errno = armed.error_number;
  return true;
}

template <typename Function>
Function* Real(const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

std::string PathOf(int fd) {
  std::array<char, 256> path{};
  const ssize_t length =
      readlink(("/proc/self/fd/" + std::to_string(fd)).c_str(), path.data(), path.size());
  return {path.data(), length > 0 ? static_cast<std::size_t>(length) : 0};
}

// Keeps what staging has made, with its full path.
void NoteMade(const std::string& name) {
  if (name.find("lumozip") != std::string::npos) {
    std::ofstream(made_path, std::ios::app) << std::filesystem::absolute(name).string() << '\n';
  }
}

}  // namespace

void SetLibcFault(const LibcFault& fault) { armed = fault; }

void SetLogFile(const std::string& path) {
  constexpr mode_t kMode = 0600;
  if (log_file >= 0) {
    close(log_file);
  }
  made_path = path + ".made";
  log_file = open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, kMode);
}

std::vector<std::string> StagedPaths() {
  std::vector<std::string> paths;
  std::ifstream file(made_path);
  for (std::string path; std::getline(file, path);) {
    if (std::filesystem::exists(std::filesystem::symlink_status(path))) {
      paths.push_back(path);
    }
  }
  return paths;
}

extern "C" {

void syslog(int /*priority*/, const char* format, ...) {
  std::array<char, 8192> line{};
  va_list arguments;
  va_start(arguments, format);
  const int length = std::vsnprintf(line.data(), line.size() - 1, format, arguments);
  va_end(arguments);
  const std::size_t end = std::min(static_cast<std::size_t>(length), line.size() - 2);
  line[end] = '\n';
  static auto* const real = Real<ssize_t(int, const void*, size_t)>("write");
  (void)real(log_file, line.data(), end + 1);
}

int mkstemp(char* name) {
  static auto* const real = Real<int(char*)>("mkstemp");
  const int fd = Hits("mkstemp", name) ? -1 : real(name);
  if (fd >= 0) {
    NoteMade(name);
  }
  return fd;
}

char* mkdtemp(char* name) {
  static auto* const real = Real<char*(char*)>("mkdtemp");
  char* const made = Hits("mkdtemp", name) ? nullptr : real(name);
  if (made != nullptr) {
    NoteMade(name);
  }
  return made;
}

int chdir(const char* path) {
  static auto* const real = Real<int(const char*)>("chdir");
  return Hits("chdir", path) ? -1 : real(path);
}

int symlink(const char* target, const char* link) {
  static auto* const real = Real<int(const char*, const char*)>("symlink");
  return Hits("symlink", target) ? -1 : real(target, link);
}

ssize_t write(int fd, const void* data, size_t size) {
  static auto* const real = Real<ssize_t(int, const void*, size_t)>("write");
  const bool is_short = armed.call == "write" && size > 0 && Hits("write", PathOf(fd));
  return real(fd, data, is_short ? size - 1 : size);
}
}
