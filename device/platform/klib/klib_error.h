// The error channel of the system library.
#pragma once

namespace Device {

void SetKlibError(int error_number, const char* file, int line);

}  // namespace Device

// Leaves an error number with the place where it arose.
#define KLIB_ERROR(error_number) Device::SetKlibError((error_number), __FILE__, __LINE__)
