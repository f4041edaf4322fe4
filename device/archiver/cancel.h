#pragma once

#include "device/base/file_descriptor.h"

namespace Archiver {

// Turns SIGTERM, SIGINT and SIGHUP, and a report that nobody reads any more, into a condition which
// the job checks at its own pace. While it lives these signals and SIGPIPE have no other effect.
class Cancel {
 public:
  explicit Cancel(int report_fd);

  // Throws Cancelled when the job is to stop.
  void Check() const;

  int SignalFd() const { return signals_.Get(); }
  int ReportFd() const { return report_fd_; }

 private:
  int report_fd_;
  Device::FileDescriptor signals_;
};

}  // namespace Archiver
