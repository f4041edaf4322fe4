// An emulator of user programs leaves the start of a program to the kernel, which knows none of the
// emulated kind. These bodies come before libc's and put the emulator in front of such a program.
#include <dlfcn.h>
#include <elf.h>
#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>
#include <string>
#include <vector>

#include "device/base/file_descriptor.h"
#include "tests/emulation.h"

namespace {

using Device::FileDescriptor;

constexpr char kDescriptors[] = "/proc/self/fd/";

// Opened by the first of the programs and inherited by the others: one that has taken on another
// identity may have no way to walk there.
int OpenSysroot() {
  constexpr char kVariable[] = "KAVO_SYSROOT_DESCRIPTOR";
  if (const char* const inherited = getenv(kVariable)) {
    return std::atoi(inherited);
  }
  const int sysroot = open(KAVO_SYSROOT, O_PATH | O_DIRECTORY);
  setenv(kVariable, std::to_string(sysroot).c_str(), 1);
  return sysroot;
}

const int kSysroot = OpenSysroot();

template <typename Function>
Function* Real(const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

bool IsForThisKind(const char* program) {
  const FileDescriptor file(open(program, O_RDONLY | O_CLOEXEC));
  Elf32_Ehdr header{};
  return read(file.Get(), &header, sizeof header) == sizeof header &&
         std::string(header.e_ident, header.e_ident + SELFMAG) == ELFMAG &&
         header.e_machine == EM_ARM;
}

// What the kernel is to start for `program`.
class Start {
 public:
  Start(const char* program, char* const* arguments) : program_(program), arguments_(arguments) {
    const std::string path = program;
    if (path.rfind(kDescriptors, 0) == 0) {
      KeepOpen(std::atoi(path.c_str() + sizeof kDescriptors - 1));
    }
    if (!kIsEmulated || !IsForThisKind(program)) {
      return;
    }
    KeepOpen(kSysroot);
    const char* const name = *arguments;
    for (const char* part : {KAVO_EMULATOR, "-L", libraries_.c_str(), "-0", name, program}) {
      whole_.push_back(const_cast<char*>(part));
    }
    do {
      whole_.push_back(*++arguments);
    } while (*arguments != nullptr);
    program_ = KAVO_EMULATOR;
    arguments_ = whole_.data();
  }
  Start(const Start&) = delete;
  Start& operator=(const Start&) = delete;
  ~Start() {
    if (kept_ >= 0) {
      fcntl(kept_, F_SETFD, FD_CLOEXEC);
    }
  }

  const char* Program() const { return program_; }
  char* const* Arguments() const { return arguments_; }

 private:
  // An emulator, or a script's shell, opens its program when it runs already.
  void KeepOpen(int fd) {
    if (fcntl(fd, F_GETFD) == FD_CLOEXEC && fcntl(fd, F_SETFD, 0) == 0) {
      kept_ = fd;
    }
  }

  const char* program_;
  char* const* arguments_;
  const std::string libraries_ = kDescriptors + std::to_string(kSysroot);
  std::vector<char*> whole_;
  int kept_ = -1;
};

}  // namespace

extern "C" {

int execve(const char* program, char* const* arguments, char* const* environment) noexcept {
  const Start start(program, arguments);
  return Real<decltype(execve)>("execve")(start.Program(), start.Arguments(), environment);
}
}
