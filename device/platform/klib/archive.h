// The archiver that stands behind /usr/bin/7z, and the archive that it has made.
#pragma once

#include <cstdint>
#include <string>

#include "device/base/child_process.h"
#include "device/base/file_descriptor.h"

namespace Device {

// The archiver as it runs: the other end of its standard input, and where its archive is to stand.
struct ArchiverRun {
  FileDescriptor call;
  std::string archive;  // path
};

// What this process's archiver has told.
struct ArchiverNews {
  std::string file;        // that is packed; empty: none was named yet
  std::string reason;      // why it failed; empty: it did not, or gave none
  std::uint64_t size = 0;  // of the archive that was made, in bytes

  // Takes what a line of its output says.
  void Take(const std::string& line);
};

ArchiverNews& TheArchiverNews();

// Starts the device's archiver with the module's argument vector; the password in it is handed over
// by descriptor, as everybody can read argument lists. Throws std::exception, among others when the
// working directory is no longer the folder in which the sources were found.
ChildProcess StartArchiver(char* const* argument_vector, int output, ArchiverRun& run);

// Takes over what the archiver has made, once it has ended well.
void TakeArchive(const ArchiverRun& run);

// The file that operations on a job's archive are to touch, opened as a path: the one that the
// archiver made for that path in this process, wherever it lies by now. When it made none, the one
// that lay there when the archiver was started: a regular file with a single link, and no link on
// the way below a shared folder. Invalid when that was something else: nothing is to be touched.
FileDescriptor OpenArchive(const std::string& path);

}  // namespace Device
