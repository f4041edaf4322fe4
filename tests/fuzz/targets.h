// What a fuzzer, and the suite over tests/corpus, feed with any bytes. Each target throws when a
// property does not hold, and lets out whatever the code under it should not have thrown.
#pragma once

#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "tests/programs.h"

void FuzzDeviceConfig(const std::string& input);
void FuzzStagingList(const std::string& input);
void FuzzStartRequest(const std::string& input);
void FuzzTaskRequest(const std::string& input);

struct FuzzTarget {
  const char* name;  // of its folder in tests/corpus
  void (*run)(const std::string& input);
};
inline constexpr FuzzTarget kFuzzTargets[] = {
    {"device_config", FuzzDeviceConfig},
    {"staging_list", FuzzStagingList},
    {"start_request", FuzzStartRequest},
    {"task_request", FuzzTaskRequest},
};

inline void Require(bool holds, const char* property) {
  if (!holds) {
    throw std::logic_error(std::string("does not hold: ") + property);
  }
}

// The parts between separators, the last one included.
inline Strings SplitAt(char separator, const std::string& text) {
  Strings parts;
  std::istringstream stream(text + separator);
  for (std::string part; std::getline(stream, part, separator);) {
    parts.push_back(part);
  }
  return parts;
}
