#pragma once

#include <chrono>
#include <cstdint>
#include <string>

#include "device/archiver/cancel.h"

namespace Archiver {

// The lines which the caller reads, each as soon as it is known; a caller that is slow to read
// holds up the job but never its cancellation.
class Report {
 public:
  explicit Report(const Cancel& cancel) : cancel_(cancel) {}

  // Only the first call counts: a job reports one sum.
  void Total(uint64_t bytes);
  // Says it once for as long as the name stays the same.
  void Compressing(const std::string& name);
  // Never goes backwards and leaves 100 to Done().
  void Progress(uint64_t percent);
  // To be told before the first progress: each one costs the caller a look at what it knows of the
  // job, which grows with the sources, so that of many come seldom.
  void Pace(size_t sources);
  // The archive stands under its final name.
  void Done();
  void Error(const std::string& reason);
  // The same for a run that was cancelled, if somebody still reads; never blocks.
  void CancelledRun();
  // The same for a run that was killed, said by another process.
  static void KilledRun(int report_fd);

 private:
  void Line(const std::string& text);
  void Percent(int percent);

  using Clock = std::chrono::steady_clock;
  static constexpr std::chrono::microseconds kPausePerSource{50};

  const Cancel& cancel_;
  bool has_total_ = false;
  int percent_ = -1;
  Clock::duration percent_pause_{};
  Clock::time_point next_percent_;
  std::string name_;
};

}  // namespace Archiver
