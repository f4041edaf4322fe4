#include "device/host/session.h"

#include <sys/mman.h>

#include <cerrno>
#include <new>
#include <system_error>

namespace Device {

namespace {

using Flag = std::atomic<bool>;
static_assert(Flag::is_always_lock_free, "a lock would be one process's own");

Flag* MakeShared() {
  void* const memory =
      mmap(nullptr, sizeof(Flag), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  if (memory == MAP_FAILED) {
    throw std::system_error(errno, std::generic_category(), "shared memory");
  }
  return new (memory) Flag(false);
}

void Unmap(Flag* flag) { munmap(flag, sizeof(Flag)); }

}  // namespace

SharedFlag::SharedFlag() : flag_(MakeShared(), Unmap) {}

}  // namespace Device
