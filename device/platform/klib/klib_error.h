// The error channel of the system library.
#pragma once

namespace Device {

// Leaves an error number with the place where it arose, and returns -1.
int KlibError(int error_number, const char* file = __builtin_FILE(), int line = __builtin_LINE());

}  // namespace Device
