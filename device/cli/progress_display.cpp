#include "device/cli/progress_display.h"

#include <unistd.h>

#include <algorithm>
#include <iostream>
#include <string>

namespace Device {

namespace {
constexpr int kBarWidth = 40;
constexpr char kEraseLine[] = "\r\x1b[K";
}  // namespace

ProgressDisplay::ProgressDisplay() : is_terminal_(isatty(STDOUT_FILENO) != 0) {}

void ProgressDisplay::Show(int percent) {
  if (percent == shown_) {
    return;
  }
  shown_ = percent;
  if (!is_terminal_) {
    std::cout << percent << " %" << std::endl;
    return;
  }
  const int filled = std::clamp(percent, 0, 100) * kBarWidth / 100;
  std::cout << kEraseLine << '[' << std::string(filled, '#') << std::string(kBarWidth - filled, ' ')
            << "] " << percent << " %" << std::flush;
}

void ProgressDisplay::Clear() const {
  if (is_terminal_) {
    std::cout << kEraseLine << std::flush;
  }
}

}  // namespace Device
