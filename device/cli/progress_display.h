// A job's progress on standard output: a bar on a terminal, a line per change elsewhere.
#pragma once

namespace Device {

class ProgressDisplay {
 public:
  ProgressDisplay();

  // `percent` from 0 to 100. Draws nothing when it has not changed.
  void Show(int percent);
  // Takes the bar off the terminal.
  void Clear() const;

 private:
  bool is_terminal_;
  int shown_ = -1;
};

}  // namespace Device
