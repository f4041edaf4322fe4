#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace Archiver {

struct Event {
  enum class Kind { kTotal, kFile, kPercent };
  Kind kind;
  uint64_t value = 0;  // bytes or percent
  std::string name;    // of a file
};

// Reads the standard output of "7z -bsp1": lines, with progress texts between them, five a second
// at most, which 7z wipes by backspaces, blanks and backspaces before it goes on. They name the
// file that it is at, cut in the middle when it is long. A line for each file would be had by -bb1,
// but costs a job of many small files a twentieth of its time.
class OutputParser {
 public:
  // Takes the next bytes, however they were cut, and returns what they complete.
  std::vector<Event> Feed(const std::string& bytes);

 private:
  size_t TakeProgress(std::string_view line, std::vector<Event>* events);
  void TakeLine(const std::string& line, std::vector<Event>* events);

  std::string pending_;
  bool percent_seen_ = false;  // in the text that pending_ begins with
};

}  // namespace Archiver
