#pragma once

#include <set>
#include <string>
#include <vector>

#include "device/archiver/cancel.h"
#include "device/archiver/report.h"

namespace Archiver {

extern const char* const kStock7z;

struct Child7z {
  std::string program = kStock7z;
  std::vector<std::string> arguments;  // without the program's name
  std::string folder;                  // its working directory
  int input_fd = -1;                   // its standard input; -1 for none
  std::vector<int> kept_fds;           // stay open under their numbers
  std::set<std::string> left_out;      // it may warn about these and do without them
};

// Runs 7z to its end and passes on what it reports. Throws Failure when it did not pack everything
// it was asked to, as soon as that is known, and Cancelled when the job is to stop; 7z is gone in
// each case. It dies with this process, however that ends.
void Run7z(const Child7z& child, const Cancel& cancel, Report& report);

}  // namespace Archiver
