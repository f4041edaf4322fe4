#include "device/cli/progress_bar.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <iterator>

#include "device/cli/output.h"

namespace Device {

namespace {

constexpr std::size_t kBarColumns = 20;
constexpr std::size_t kUsualColumns = 80;
constexpr char kEraseLine[] = "\r\x1b[K";

std::size_t Columns() {
  winsize size{};
  return ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0 ? size.ws_col
                                                                         : kUsualColumns;
}

template <typename... Values>
std::string Format(const char* format, Values... values) {
  char text[64];
  std::snprintf(text, sizeof text, format, values...);
  return text;
}

std::string SizeText(double bytes) {
  constexpr const char* kUnits[] = {"B", "KiB", "MiB", "GiB", "TiB"};
  std::size_t unit = 0;
  for (; bytes >= 1000 && unit + 1 < std::size(kUnits); ++unit) {
    bytes /= 1024;
  }
  return Format(unit == 0 ? "%.0f %s" : "%.1f %s", bytes, kUnits[unit]);
}

std::string TimeText(double seconds) {
  const auto whole = static_cast<int>(std::min(seconds, 1e9));
  return Format("%d:%02d:%02d", whole / 3600, whole / 60 % 60, whole % 60);
}

}  // namespace

ProgressBar::ProgressBar(bool is_quiet) {
  const char* const terminal = std::getenv("TERM");
  is_shown_ = !is_quiet && isatty(STDERR_FILENO) != 0 && terminal != nullptr &&
              std::strcmp(terminal, "dumb") != 0;
}

void ProgressBar::Show(const Json::Value& task) {
  if (!is_shown_) {
    return;
  }
  const std::size_t columns = Columns() - 1;  // in the last one, some terminals begin a new line
  std::string line;
  // What there is room for, the most needed first.
  const auto add = [&](const std::string& part) {
    line += !part.empty() && line.size() + 2 + part.size() <= columns ? "  " + part : "";
  };
  if (task["state"] == "waiting") {
    line = StateText(task);
  } else {
    const double share = task["state"] == "finished" ? 1 : task["progress"].asDouble();
    const double total = task["total_size"].asDouble();
    if (first_share_ < 0) {
      first_share_ = share;
      since_ = Clock::now();
    }
    const double seconds = std::chrono::duration<double>(Clock::now() - since_).count();
    const double gained = share - first_share_;
    const auto filled = static_cast<std::size_t>(share * kBarColumns);
    line = Format("%3d %%", static_cast<int>(std::lround(share * 100)));
    add("[" + std::string(filled, '#') + std::string(kBarColumns - filled, ' ') + "]");
    if (total > 0) {
      add(SizeText(share * total) + " of " + SizeText(total));
    }
    if (total > 0 && gained > 0 && seconds > 0) {
      add(SizeText(gained * total / seconds) + "/s");
      add(share < 1 ? TimeText(seconds * (1 - share) / gained) + " left"
                    : "in " + TimeText(seconds));
    }
    add(Printable(task["file"].asString(), columns - std::min(columns, line.size() + 2)));
  }
  std::cerr << kEraseLine << line.substr(0, columns) << (task["state"] == "finished" ? "\n" : "")
            << std::flush;
}

void ProgressBar::Clear() const {
  if (is_shown_) {
    std::cerr << kEraseLine << std::flush;
  }
}

}  // namespace Device
