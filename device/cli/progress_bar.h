// A job's progress on standard error, when that is a terminal: a line that is drawn over.
#pragma once

#include <json/json.h>

#include <chrono>

namespace Device {

class ProgressBar {
 public:
  explicit ProgressBar(bool is_quiet);

  // `task` as TaskView has it. The line is never wider than the window; of a finished one it stays.
  void Show(const Json::Value& task);
  // Takes it off the terminal.
  void Clear() const;

 private:
  using Clock = std::chrono::steady_clock;

  bool is_shown_;
  double first_share_ = -1;  // that was seen, and when
  Clock::time_point since_;
};

}  // namespace Device
