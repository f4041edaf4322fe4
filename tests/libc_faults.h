// Makes libc calls of this process and those forked from it fail, and keeps what they log.
#ifndef TESTS_LIBC_FAULTS_H_
#define TESTS_LIBC_FAULTS_H_

#include <string>
#include <vector>

// One call of mkstemp, mkdtemp, chdir, symlink or write (to a list file; written short by one byte)
// fails: that whose first argument holds `part`. An empty name: none.
struct LibcFault {
  std::string call;
  std::string part;
  int error_number = 0;
};
void SetLibcFault(const LibcFault& fault);

// Log lines go to this file instead of the system's log.
void SetLogFile(const std::string& path);

// The list files and staging folders made since the log file was set that are still there.
std::vector<std::string> StagedPaths();

#endif  // TESTS_LIBC_FAULTS_H_
