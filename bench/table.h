// The table that the benchmark prints, in Markdown.
#pragma once

#include <string>

namespace Bench {

struct Range {
  double from = 0;
  double to = 0;
};

struct Medians {
  double ours = 0;  // seconds
  double theirs = 0;
  double ratio = 0;  // the median of the ratios
  Range ratios;      // the middle half of them
  Range repeats;     // the middle half of theirs' ratios to theirs: the noise
};

// Prints a row. `limit` is the ratio to reach; `ratios` and `repeats` are ranges, if known.
void PrintRow(const std::string& what, const std::string& ours, const std::string& theirs,
              double ratio, const std::string& limit, const std::string& ratios = "",
              const std::string& repeats = "");
void PrintRow(const std::string& what, const Medians& medians, const std::string& limit);

std::string Milliseconds(double seconds);

}  // namespace Bench
