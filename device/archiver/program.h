#pragma once

#include <functional>
#include <string>

#include "device/archiver/cancel.h"
#include "device/base/child_process.h"

namespace Archiver {

// Takes what a program prints, in pieces.
using OutputReader = std::function<void(const std::string& bytes)>;

// Runs a program to its end, passes on what it prints on its standard output and error, and returns
// the wait status. Throws Failure when it cannot, Cancelled when the job is to stop, and what the
// readers throw; the program is gone in each case. It dies with this process, however that ends.
int RunProgram(Device::ProgramStart start, const Cancel& cancel, const OutputReader& output_reader,
               const OutputReader& errors_reader);

}  // namespace Archiver
