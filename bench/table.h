// The table that the benchmark prints, in Markdown.
#ifndef BENCH_TABLE_H_
#define BENCH_TABLE_H_

#include <string>

namespace Bench {

struct Medians {
  double ours = 0;  // seconds
  double theirs = 0;
};

// Prints a row. `limit` is the ratio to reach; empty for none.
void PrintRow(const std::string& what, const std::string& ours, const std::string& theirs,
              double ratio, const std::string& limit);
void PrintRow(const std::string& what, const Medians& medians, const std::string& limit);

}  // namespace Bench

#endif  // BENCH_TABLE_H_
