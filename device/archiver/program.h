// Running the programs of others.
#pragma once

#include <functional>
#include <set>
#include <string>

#include "device/archiver/report.h"
#include "device/base/child_process.h"

namespace Archiver {

extern const char* const kStock7z;

// Takes what a program prints, in pieces.
using OutputReader = std::function<void(const std::string& bytes)>;

// Runs a program to its end, passes on what it prints on its standard output and error, and returns
// the wait status. Throws Cancelled when the job is to stop, what the readers throw, and
// std::system_error when it cannot; the program is gone in each case. It dies with this process,
// however that ends.
int RunProgram(Device::ProgramStart start, const Report& report, const OutputReader& output_reader,
               const OutputReader& errors_reader);

// Runs 7z as above and passes on what it prints; locale, time zone and the streams but for the
// input are its own affair. About the names left out it may warn and do without them. Throws
// Failure when it did not pack everything it was asked to, as soon as that is known.
void Run7z(Device::ProgramStart start, const std::set<std::string>& left_out, const Report& report,
           const OutputReader& reader);

}  // namespace Archiver
