#pragma once

#include <set>
#include <string>

#include "device/archiver/program.h"

namespace Archiver {

extern const char* const kStock7z;

// Runs 7z as RunProgram does and passes on what it prints; the environment and the streams but for
// the input are its own affair. About the names left out it may warn and do without them. Throws
// Failure when it did not pack everything it was asked to, as soon as that is known.
void Run7z(Device::ProgramStart start, const std::set<std::string>& left_out, const Cancel& cancel,
           const OutputReader& reader);

}  // namespace Archiver
