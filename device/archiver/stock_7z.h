#pragma once

#include <functional>
#include <set>
#include <string>

#include "device/archiver/cancel.h"
#include "device/base/child_process.h"

namespace Archiver {

extern const char* const kStock7z;

// Takes what 7z prints, in pieces.
using OutputReader = std::function<void(const std::string& bytes)>;

// Runs 7z to its end and passes on what it prints; the environment and the streams but for the
// input are its own affair. About the names left out it may warn and do without them. Throws
// Failure when it did not pack everything it was asked to, as soon as that is known, and Cancelled
// when the job is to stop; 7z is gone in each case. It dies with this process, however that ends.
void Run7z(Device::ProgramStart start, const std::set<std::string>& left_out, const Cancel& cancel,
           const OutputReader& reader);

}  // namespace Archiver
