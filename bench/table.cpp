#include "bench/table.h"

#include <cstdio>
#include <iostream>

namespace Bench {

namespace {

std::string Format(const char* format, double value) {
  char text[32];
  std::snprintf(text, sizeof text, format, value);
  return text;
}

std::string Text(const Range& range) {
  return Format("%.2f", range.from) + " to " + Format("%.2f", range.to);
}

}  // namespace

void PrintRow(const std::string& what, const std::string& ours, const std::string& theirs,
              double ratio, const std::string& limit, const std::string& ratios,
              const std::string& repeats) {
  std::cout << "| " << what << " | " << ours << " | " << theirs << " | " << Format("%.2f", ratio)
            << " | " << ratios << " | " << repeats << " | " << limit << " |" << std::endl;
}

void PrintRow(const std::string& what, const Medians& medians, const std::string& limit) {
  PrintRow(what, Milliseconds(medians.ours), Milliseconds(medians.theirs), medians.ratio, limit,
           Text(medians.ratios), Text(medians.repeats));
}

std::string Milliseconds(double seconds) {
  constexpr double kMilli = 1000;
  return Format("%.4g ms", kMilli * seconds);
}

}  // namespace Bench
