// The program's own bodies of libc calls come before libc's, for the module too. None of them
// allocates memory before it has told the module's calls from others': some run in signal handlers.
#include "tests/libc_calls.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>

namespace {

LibcFault armed;
int log_file = -1;
int trace_file = -1;
const void* module_base = nullptr;
void (*dump_coverage)() = nullptr;
std::string made_path;

const void* BaseOf(const void* address) {
  Dl_info info{};
  return dladdr(address, &info) != 0 ? info.dli_fbase : nullptr;
}

bool IsModule(const void* caller) {
  return module_base != nullptr && BaseOf(caller) == module_base;
}

template <typename Function>
Function* Real(const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

void WriteRaw(int fd, const char* text, std::size_t size) {
  static auto* const real = Real<ssize_t(int, const void*, size_t)>("write");
  (void)real(fd, text, size);
}

// One line of JSON on the stack.
class TraceLine {
 public:
  explicit TraceLine(const char* call) {
    Add(R"({"pid":)");
    AddNumber(getpid());
    Add(R"(,"call":")");
    Add(call);
    Add(R"(","args":[)");
  }
  ~TraceLine() {
    Add("]}\n");
    if (trace_file >= 0) {
      WriteRaw(trace_file, text_.data(), size_);
    }
    errno = saved_errno_;
  }
  TraceLine(const TraceLine&) = delete;
  TraceLine& operator=(const TraceLine&) = delete;

  TraceLine& Argument(const char* text) {
    Add(is_first_ ? "\"" : ",\"");
    for (; *text != 0; ++text) {
      const auto byte = static_cast<unsigned char>(*text);
      if (byte < ' ' || byte == '"' || byte == '\\') {
        std::array<char, 8> code{};
        std::snprintf(code.data(), code.size(), "\\u%04x", byte);
        Add(code.data());
      } else {
        Put(*text);
      }
    }
    Add("\"");
    is_first_ = false;
    return *this;
  }
  TraceLine& Argument(int number) {
    Add(is_first_ ? "" : ",");
    AddNumber(number);
    is_first_ = false;
    return *this;
  }

 private:
  void Put(char byte) {
    if (size_ + 4 < text_.size()) {  // room for the end is kept
      text_[size_++] = byte;
    }
  }
  void Add(const char* text) {
    for (; *text != 0; ++text) {
      size_ < text_.size() ? void(text_[size_++] = *text) : void();
    }
  }
  void AddNumber(int number) {
    std::array<char, 16> digits{};
    std::snprintf(digits.data(), digits.size(), "%d", number);
    Add(digits.data());
  }

  std::array<char, 16384> text_;
  std::size_t size_ = 0;
  bool is_first_ = true;
  int saved_errno_ = errno;
};

bool Fails(const char* call, const char* argument) {
  if (armed.call != call || std::strstr(argument, armed.part.c_str()) == nullptr) {
    return false;
  }
  if (armed.signal_number != 0) {
    raise(armed.signal_number);
    return false;
  }
  errno = armed.error_number;
  return true;
}

// Keeps what staging has made, with its full path.
void NoteMade(const char* name) {
  std::ofstream(made_path, std::ios::app) << std::filesystem::absolute(name).string() << '\n';
}

}  // namespace

void WatchModule(const void* address) {
  module_base = BaseOf(address);
  Dl_info info{};
  dladdr(address, &info);
  void* const module = dlopen(info.dli_fname, RTLD_NOW | RTLD_NOLOAD);
  dump_coverage = reinterpret_cast<void (*)()>(dlsym(module, "KavoDumpCoverage"));
  dlclose(module);
}

void SetLibcTrace(const std::string& path) {
  if (trace_file >= 0) {
    close(trace_file);
  }
  trace_file = open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
}

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

void syslog(int priority, const char* format, ...) {
  std::array<char, 8192> line{};
  std::size_t start = 0;
  if (priority != LOG_ERR) {
    start = static_cast<std::size_t>(std::snprintf(line.data(), line.size(), "<%d>", priority));
  }
  va_list arguments;
  va_start(arguments, format);
  std::vsnprintf(line.data() + start, line.size() - start - 1, format, arguments);
  va_end(arguments);
  if (IsModule(__builtin_return_address(0))) {
    const TraceLine trace("syslog");
  }
  const std::size_t size = std::strlen(line.data());
  line[size] = '\n';
  WriteRaw(log_file, line.data(), size + 1);
}

int mkstemp(char* name) {
  static auto* const real = Real<int(char*)>("mkstemp");
  if (!IsModule(__builtin_return_address(0))) {
    return real(name);
  }
  TraceLine("mkstemp").Argument(name);
  const int fd = Fails("mkstemp", name) ? -1 : real(name);
  if (fd >= 0) {
    NoteMade(name);
  }
  return fd;
}

char* mkdtemp(char* name) {
  static auto* const real = Real<char*(char*)>("mkdtemp");
  if (!IsModule(__builtin_return_address(0))) {
    return real(name);
  }
  TraceLine("mkdtemp").Argument(name);
  char* const made = Fails("mkdtemp", name) ? nullptr : real(name);
  if (made != nullptr) {
    NoteMade(name);
  }
  return made;
}

int chdir(const char* path) {
  static auto* const real = Real<int(const char*)>("chdir");
  if (!IsModule(__builtin_return_address(0))) {
    return real(path);
  }
  TraceLine("chdir").Argument(path);
  return Fails("chdir", path) ? -1 : real(path);
}

int stat(const char* path, struct stat* status) {
  if (!IsModule(__builtin_return_address(0))) {
    return fstatat(AT_FDCWD, path, status, 0);
  }
  TraceLine("stat").Argument(path);
  return Fails("stat", path) ? -1 : fstatat(AT_FDCWD, path, status, 0);
}

int lstat(const char* path, struct stat* status) {
  if (IsModule(__builtin_return_address(0))) {
    TraceLine("lstat").Argument(path);
  }
  return fstatat(AT_FDCWD, path, status, AT_SYMLINK_NOFOLLOW);
}

int access(const char* path, int mode) {
  if (IsModule(__builtin_return_address(0))) {
    TraceLine("access").Argument(path).Argument(mode);
  }
  return faccessat(AT_FDCWD, path, mode, 0);
}

int symlink(const char* target, const char* link) {
  if (!IsModule(__builtin_return_address(0))) {
    return symlinkat(target, AT_FDCWD, link);
  }
  TraceLine("symlink").Argument(target).Argument(link);
  return Fails("symlink", target) ? -1 : symlinkat(target, AT_FDCWD, link);
}

int unlink(const char* path) {
  if (IsModule(__builtin_return_address(0))) {
    TraceLine("unlink").Argument(path);
  }
  return unlinkat(AT_FDCWD, path, 0);
}

ssize_t write(int fd, const void* data, size_t size) {
  static auto* const real = Real<ssize_t(int, const void*, size_t)>("write");
  if (!IsModule(__builtin_return_address(0))) {
    return real(fd, data, size);
  }
  const std::string text(static_cast<const char*>(data), size);
  TraceLine("write").Argument(text.c_str());
  return real(fd, data, Fails("write", text.c_str()) ? size - 1 : size);
}

int close(int fd) {
  static auto* const real = Real<int(int)>("close");
  if (IsModule(__builtin_return_address(0))) {
    const TraceLine trace("close");
  }
  return real(fd);
}

int kill(pid_t pid, int signal_number) noexcept {
  static auto* const real = Real<int(pid_t, int)>("kill");
  if (IsModule(__builtin_return_address(0))) {
    TraceLine("kill").Argument(pid).Argument(signal_number);
  }
  return real(pid, signal_number);
}

sighandler_t signal(int signal_number, sighandler_t handler) noexcept {
  static auto* const real = Real<sighandler_t(int, sighandler_t)>("signal");
  if (IsModule(__builtin_return_address(0))) {
    TraceLine("signal").Argument(signal_number);
  }
  return real(signal_number, handler);
}

void exit(int status) noexcept {
  if (IsModule(__builtin_return_address(0))) {
    TraceLine("exit").Argument(status);
  }
  Real<void(int)>("exit")(status);
  abort();
}

void _exit(int status) {  // NOLINT: the system's name
  if (IsModule(__builtin_return_address(0))) {
    TraceLine("_exit").Argument(status);
  }
  if (dump_coverage != nullptr) {
    dump_coverage();
  }
  Real<void(int)>("_exit")(status);
  abort();
}
}
