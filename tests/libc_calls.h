// What the module asks of libc: seen in the trace, between the platform's operations, and made to
// fail. Calls of other code in the process are left alone.
#pragma once

#include <string>

#include "tests/programs.h"

// From now on the calls of the library with this handle count as the module's.
void WatchModule(void* module);

// In this folder, "trace" gets a line of JSON for each of the module's calls, like the device's
// own; "log" the lines for the system's log, those below LOG_ERR with their level.
void SetLibcFiles(const std::string& folder);

// One of mkstemp, mkdtemp, chdir, stat, symlink or write (short by one byte) fails when its first
// argument, or the file's path, holds `part`. With a signal the process gets that, also
// at an _exit, and the call goes on. An empty name: none.
struct LibcFault {
  std::string call;
  std::string part;
  int error_number = 0;
  int signal_number = 0;
};
void SetLibcFault(const LibcFault& fault);

// The list files and staging folders made since the folder was set that are still there.
Strings StagedPaths();
