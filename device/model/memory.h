// How much memory the machine has.
#pragma once

#include <cstdint>

namespace Device {

// Bytes that this process and its children may have: what is installed or, if that is less, the
// limit of a control group that it is in, or of its address space.
std::uint64_t InstalledMemory();

}  // namespace Device
