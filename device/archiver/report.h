#pragma once

#include <cstdint>
#include <string>

#include "device/base/file_descriptor.h"

namespace Archiver {

// The lines which the caller reads, each as soon as it is known, and whether the job is to stop: at
// SIGTERM, SIGINT and SIGHUP, and when nobody reads the lines any more. While it lives these
// signals and SIGPIPE have no other effect; the job asks at its own pace. A caller that is slow to
// read holds up the job but never its cancellation.
class Report {
 public:
  explicit Report(int fd);

  // Throws Cancelled when the job is to stop.
  void CheckCancelled() const;

  // Only the first call counts: a job reports one sum.
  void Total(uint64_t bytes);
  // Says it once for as long as the name stays the same.
  void Compressing(const std::string& name);
  // Never goes backwards and leaves 100 to Done().
  void Progress(uint64_t percent);
  // The archive stands under its final name.
  void Done();
  void Error(const std::string& reason);
  // For the device's log.
  void Note(const std::string& text);
  // The error of a run that was cancelled, if somebody still reads; never blocks.
  void CancelledRun();

  int Fd() const { return fd_; }
  int SignalFd() const { return signals_.Get(); }

 private:
  void Line(const std::string& text);
  void Percent(int percent);

  const int fd_;
  Device::FileDescriptor signals_;
  bool has_total_ = false;
  int percent_ = -1;
  std::string name_;
};

}  // namespace Archiver
