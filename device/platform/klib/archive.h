// The archiver that stands behind /usr/bin/7z, and the archive that it has made.
#pragma once

#include <json/json.h>

#include <string>

#include "device/base/child_process.h"
#include "device/base/file_descriptor.h"

namespace Device {

// The archiver as it runs: the other end of its standard input, and where its archive is to stand.
struct ArchiverRun {
  FileDescriptor call;
  std::string archive;  // path
};

// What this process's archiver has told, for the task: an object of kArchiverFile, kArchiverReason
// and kArchiverSize, as far as they are known.
Json::Value& TheArchiverNews();
// Takes what a line of its output says.
void TakeArchiverLine(const std::string& line);

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
