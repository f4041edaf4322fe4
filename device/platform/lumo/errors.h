// The channel that LumoLibGetErr reads, and what error codes mean in words.
#pragma once

#include <map>
#include <string>

#include "platform/kavo/error_codes.h"

namespace Device {

// Leaves the code for LumoLibGetErr, and returns -1.
int SetLastError(int code);
// Leaves the code for a system error number, and returns -1.
int SetLastErrno(int error_number);

// What a web API error code means, in English. Never null.
const char* ErrorText(int code);
// All of them.
const std::map<int, std::string>& ErrorTexts();

}  // namespace Device
