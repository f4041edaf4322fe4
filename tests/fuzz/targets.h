// What a fuzzer, and the suite over tests/corpus, feed with any bytes.
#ifndef TESTS_FUZZ_TARGETS_H_
#define TESTS_FUZZ_TARGETS_H_

#include <stdexcept>
#include <string>
#include <vector>

struct FuzzTarget {
  const char* name;  // of its folder in tests/corpus
  // Throws when a property does not hold, or whatever the code under it should not have thrown.
  void (*run)(const std::string& input);
};
extern const std::vector<FuzzTarget> kFuzzTargets;

inline void Require(bool holds, const char* property) {
  if (!holds) {
    throw std::logic_error(std::string("does not hold: ") + property);
  }
}

// The parts between separators, the last one included.
std::vector<std::string> SplitAt(char separator, const std::string& text);

#endif  // TESTS_FUZZ_TARGETS_H_
