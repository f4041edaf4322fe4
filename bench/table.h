// The table that the benchmark prints, in Markdown.
#ifndef BENCH_TABLE_H_
#define BENCH_TABLE_H_

#include <string>

namespace Bench {

// Of pairs of runs, one of each side. What slows the machine for a while counts on both sides of a
// pair's ratio.
struct Medians {
  double ours = 0;  // seconds
  double theirs = 0;
  double ratio = 0;          // the median of the pairs' ratios
  double lower_quarter = 0;  // of these
  double upper_quarter = 0;
};

// Prints a row. `limit` is the ratio to reach; `spread` tells where the pairs' ratios lie, if
// known.
void PrintRow(const std::string& what, const std::string& ours, const std::string& theirs,
              double ratio, const std::string& limit, const std::string& spread = "");
void PrintRow(const std::string& what, const Medians& medians, const std::string& limit);

std::string Milliseconds(double seconds);

}  // namespace Bench

#endif  // BENCH_TABLE_H_
