// What the module asks of libc: seen in the trace, between the platform's operations, and made to
// fail. Calls of other code in the process are left alone.
#ifndef TESTS_LIBC_CALLS_H_
#define TESTS_LIBC_CALLS_H_

#include <string>

#include "tests/programs.h"

// From now on the calls of the library that holds this address count as the module's.
void WatchModule(const void* address);

// The module's calls go to this file, one line of JSON for each, like the device's own.
void SetLibcTrace(const std::string& path);

// One of mkstemp, mkdtemp, chdir, stat, symlink or write (short by one byte) fails when its first
// argument, or the file's path, holds `part`. With a signal the process gets that, and the call
// goes on. An empty name: none.
struct LibcFault {
  std::string call;
  std::string part;
  int error_number = 0;
  int signal_number = 0;
};
void SetLibcFault(const LibcFault& fault);

// Log lines go to this file instead of the system's log, those below LOG_ERR with their level.
void SetLogFile(const std::string& path);

// The list files and staging folders made since the log file was set that are still there.
Strings StagedPaths();

#endif  // TESTS_LIBC_CALLS_H_
