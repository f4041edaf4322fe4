// What a user's path names, opened for a request of that user.
#pragma once

#include <sys/stat.h>

#include <chrono>
#include <stdexcept>
#include <string>

#include "device/base/file_descriptor.h"
#include "device/host/wire.h"
#include "device/platform/lumo/paths.h"

namespace Device {

// The answer to a request that is not served, thrown from wherever that is found.
struct Refused : std::runtime_error {
  explicit Refused(int http_status, const std::string& reason)
      : std::runtime_error(reason), answer(Refusal(http_status, reason)) {}
  // With a KAVO::ErrorCode and its words.
  explicit Refused(int code);

  Answer answer;
};

// For a path that leads to no place where the user has access, throws Refused.
ResolvedPath ResolveForUser(const std::string& user, const std::string& path);
// Opens what a path was resolved to, by the identity of the process, which must be the user's;
// follows no link. Throws Refused.
FileDescriptor OpenForUser(const std::string& user, const ResolvedPath& path, int flags);

// A regular file to be read, and no other is touched: to open a pipe or a device can have effects.
// Throws Refused.
FileDescriptor OpenFileOf(const std::string& user, const ResolvedPath& path, struct stat& status);

// Ends when the time is up, or the client no longer waits for the answer.
class Patience {
 public:
  Patience(int stream, std::chrono::seconds time)
      : stream_(stream), end_(std::chrono::steady_clock::now() + time) {}

  // With a source, waits first until that can be read or patience is over.
  bool IsOver(int source = -1) const;

 private:
  int stream_;  // nothing is ever sent there: it becomes readable when the other side is closed
  std::chrono::steady_clock::time_point end_;
};

}  // namespace Device
