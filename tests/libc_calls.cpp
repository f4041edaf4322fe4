// The program's own bodies of libc calls come before libc's, for the module too. None of them
// allocates memory before it has told the module's calls from others': some run in signal handlers.
#include "tests/libc_calls.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>

namespace fs = std::filesystem;

namespace {

LibcFault armed;
int log_file = -1;
int trace_file = -1;
const void* module_base = nullptr;
std::string made_path;

const void* BaseOf(const void* address) {
  Dl_info info{};
  return dladdr(address, &info) != 0 ? info.dli_fbase : nullptr;
}

template <typename Function>
Function* Real(const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

// One line of JSON on the stack.
class TraceLine {
 public:
  explicit TraceLine(const char* call)
      : size_(std::snprintf(text_, kRoom, R"({"pid":%d,"call":"%s","args":[)", getpid(), call)) {}

  void Add(int number) { size_ += std::snprintf(text_ + size_, kRoom, "%d,", number); }
  void Add(const char* text) {
    text_[size_++] = '"';
    for (; *text != 0 && size_ + 2 * kRoom < kSize; ++text) {
      const bool is_plain =
          static_cast<unsigned char>(*text) >= ' ' && *text != '"' && *text != '\\';
      size_ += std::snprintf(text_ + size_, kRoom, is_plain ? "%c" : "\\u%04x", *text);
    }
    size_ += std::snprintf(text_ + size_, kRoom, "\",");
  }
  void Write() {
    size_ -= text_[size_ - 1] == ',' ? 1 : 0;
    size_ += std::snprintf(text_ + size_, kRoom, "]}\n");
    if (trace_file >= 0) {
      (void)Real<decltype(write)>("write")(trace_file, text_, static_cast<std::size_t>(size_));
    }
  }

 private:
  static constexpr int kSize = 16384;
  static constexpr int kRoom = 128;  // more than all that may follow a text that is cut
  char text_[kSize];
  int size_;
};

// True, and traced, when it is the module that calls.
template <typename... Arguments>
bool IsModules(const void* caller, const char* call, Arguments... arguments) {
  if (module_base == nullptr || BaseOf(caller) != module_base) {
    return false;
  }
  const int saved_errno = errno;
  TraceLine line(call);
  (line.Add(arguments), ...);
  line.Write();
  errno = saved_errno;
  return true;
}
#define IS_MODULES(...) IsModules(__builtin_return_address(0), __VA_ARGS__)

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
  std::ofstream(made_path, std::ios::app) << fs::absolute(name).string() << '\n';
}

void Reopen(int& file, const std::string& path) {
  if (file >= 0) {
    close(file);
  }
  file = open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
}

}  // namespace

void WatchModule(void* module) { module_base = BaseOf(dlsym(module, "gTable")); }

void SetLibcFiles(const std::string& folder) {
  Reopen(trace_file, folder + "/trace");
  Reopen(log_file, folder + "/log");
  made_path = folder + "/made";
}

void SetLibcFault(const LibcFault& fault) { armed = fault; }

Strings StagedPaths() {
  Strings paths = Lines(ReadFile(made_path));
  paths.erase(
      std::remove_if(paths.begin(), paths.end(),
                     [](const auto& path) { return !fs::exists(fs::symlink_status(path)); }),
      paths.end());
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
  // NOLINTNEXTLINE(clang-analyzer-valist.Uninitialized): a false alarm in runs over several files
  std::vsnprintf(line.data() + start, line.size() - start - 1, format, arguments);
  va_end(arguments);
  IS_MODULES("syslog");
  const std::size_t size = std::strlen(line.data());
  line[size] = '\n';
  (void)Real<decltype(write)>("write")(log_file, line.data(), size + 1);
}

int mkstemp(char* name) {
  const bool is_modules = IS_MODULES("mkstemp", name);
  const int fd =
      is_modules && Fails("mkstemp", name) ? -1 : Real<decltype(mkstemp)>("mkstemp")(name);
  is_modules&& fd >= 0 ? NoteMade(name) : void();
  return fd;
}

char* mkdtemp(char* name) {
  const bool is_modules = IS_MODULES("mkdtemp", name);
  char* const made =
      is_modules && Fails("mkdtemp", name) ? nullptr : Real<decltype(mkdtemp)>("mkdtemp")(name);
  is_modules&& made != nullptr ? NoteMade(name) : void();
  return made;
}

int chdir(const char* path) {
  const bool fails = IS_MODULES("chdir", path) && Fails("chdir", path);
  return fails ? -1 : Real<decltype(chdir)>("chdir")(path);
}

int stat(const char* path, struct stat* status) {
  const bool fails = IS_MODULES("stat", path) && Fails("stat", path);
  return fails ? -1 : fstatat(AT_FDCWD, path, status, 0);
}

int lstat(const char* path, struct stat* status) {
  IS_MODULES("lstat", path);
  return fstatat(AT_FDCWD, path, status, AT_SYMLINK_NOFOLLOW);
}

int access(const char* path, int mode) {
  IS_MODULES("access", path, mode);
  return faccessat(AT_FDCWD, path, mode, 0);
}

int symlink(const char* target, const char* link) {
  const bool fails = IS_MODULES("symlink", target, link) && Fails("symlink", target);
  return fails ? -1 : symlinkat(target, AT_FDCWD, link);
}

int unlink(const char* path) {
  IS_MODULES("unlink", path);
  return unlinkat(AT_FDCWD, path, 0);
}

ssize_t write(int fd, const void* data, size_t size) {
  const auto* const text = static_cast<const char*>(data);  // the module's ends with a zero
  const bool fails = IS_MODULES("write", text) && Fails("write", text);
  return Real<decltype(write)>("write")(fd, data, fails ? size - 1 : size);
}

int close(int fd) {
  IS_MODULES("close");
  return Real<decltype(close)>("close")(fd);
}

int kill(pid_t pid, int signal_number) noexcept {
  IS_MODULES("kill", pid, signal_number);
  return Real<int(pid_t, int)>("kill")(pid, signal_number);
}

sighandler_t signal(int signal_number, sighandler_t handler) noexcept {
  IS_MODULES("signal", signal_number);
  return Real<sighandler_t(int, sighandler_t)>("signal")(signal_number, handler);
}

void exit(int status) noexcept {
  IS_MODULES("exit", status);
  Real<void(int)>("exit")(status);
  abort();
}

void _exit(int status) {  // NOLINT: the system's name
  IS_MODULES("_exit", status) && Fails("_exit", "");
  Real<void(int)>("_exit")(status);
  abort();
}
}
