#ifndef DEVICE_ARCHIVER_REPORT_H_
#define DEVICE_ARCHIVER_REPORT_H_

#include <chrono>
#include <cstdint>
#include <string>

#include "device/archiver/cancel.h"

namespace Archiver {

// The lines which the caller reads. They leave with the next Flush, an error and the end at once; a
// caller that is slow to read holds up the job but never its cancellation.
class Report {
 public:
  explicit Report(const Cancel& cancel) : cancel_(cancel) {}

  // Only the first call counts: a job reports one sum.
  void Total(uint64_t bytes);
  void Compressing(const std::string& name);
  // Never goes backwards, comes ten times a second at most, as each costs the caller a write to its
  // store, and leaves 100 to Done().
  void Progress(uint64_t percent);
  // The archive stands under its final name.
  void Done();
  void Error(const std::string& reason);
  // To be called when there is nothing to add for now.
  void Flush();
  // The same for a run that was cancelled, if somebody still reads; never blocks.
  void CancelledRun();
  // The same for a run that was killed, said by another process.
  static void KilledRun(int report_fd);

 private:
  void Line(const std::string& text);
  void Percent(int percent);

  using Clock = std::chrono::steady_clock;

  const Cancel& cancel_;
  bool has_total_ = false;
  int percent_ = -1;
  Clock::time_point next_percent_;
  std::string lines_;  // that have not left yet
};

}  // namespace Archiver

#endif  // DEVICE_ARCHIVER_REPORT_H_
