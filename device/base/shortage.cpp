#include "device/base/shortage.h"

#include <malloc.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cstdio>
#include <new>

#include "device/base/file_io.h"

namespace Device {

namespace {

#ifdef __SANITIZE_ADDRESS__
constexpr bool kCanBeLimited = false;  // its shadow of all memory would count
#else
constexpr bool kCanBeLimited = true;
#endif

constexpr int kLargeBlock = 128 << 10;

void SetLimit(rlim_t bytes) {
  rlimit limit{};
  getrlimit(RLIMIT_DATA, &limit);
  limit.rlim_cur = bytes < limit.rlim_max ? bytes : limit.rlim_max;
  setrlimit(RLIMIT_DATA, &limit);
}

}  // namespace

void ThrowMemoryShortage() {
  TheShortage() = Shortage::kMemory;
  throw std::bad_alloc();
}

void LimitMemory(std::size_t bytes) {
  if (!kCanBeLimited) {
    return;
  }
  mallopt(M_MMAP_THRESHOLD, kLargeBlock);  // so that it stays: what is large goes when it is freed
  unsigned long pages = 0;
  std::sscanf(ReadTextFile("/proc/self/statm").c_str(), "%*u %*u %*u %*u %*u %lu", &pages);
  SetLimit(pages * static_cast<unsigned long>(sysconf(_SC_PAGESIZE)) + bytes);
  std::set_new_handler(ThrowMemoryShortage);
}

void LiftMemoryLimit() {
  SetLimit(RLIM_INFINITY);
  std::set_new_handler(nullptr);
}

}  // namespace Device
