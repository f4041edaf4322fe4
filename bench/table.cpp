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

}  // namespace

void PrintRow(const std::string& what, const std::string& ours, const std::string& theirs,
              double ratio, const std::string& limit) {
  std::cout << "| " << what << " | " << ours << " | " << theirs << " | " << Format("%.2f", ratio)
            << " | " << limit << " |" << std::endl;
}

void PrintRow(const std::string& what, const Medians& medians, const std::string& limit) {
  constexpr double kMilli = 1000;
  PrintRow(what, Format("%.4g ms", kMilli * medians.ours),
           Format("%.4g ms", kMilli * medians.theirs), medians.ours / medians.theirs, limit);
}

}  // namespace Bench
