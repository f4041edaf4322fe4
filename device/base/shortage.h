// What a request's process has run short of. It is kept here for who answers the request, as those
// that it passes on its way there may keep an exception to themselves.
#pragma once

#include <cstddef>

namespace Device {

enum class Shortage { kNone, kMemory, kStore };

// This process's.
inline Shortage& TheShortage() {
  static Shortage shortage = Shortage::kNone;
  return shortage;
}

// Notes it and throws std::bad_alloc.
[[noreturn]] void ThrowMemoryShortage();

// Lets the process have so many bytes more than it has now; where there are no more, operator new
// throws as above. Throws std::runtime_error.
void LimitMemory(std::size_t bytes);
void LiftMemoryLimit();

}  // namespace Device
