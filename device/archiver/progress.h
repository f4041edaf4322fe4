#ifndef DEVICE_ARCHIVER_PROGRESS_H_
#define DEVICE_ARCHIVER_PROGRESS_H_

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace Archiver {

struct Event {
  enum class Kind { kTotal, kFile, kPercent };
  Kind kind;
  uint64_t value = 0;  // bytes or percent
  std::string name;    // of the file
};

// Reads the standard output of "7z -bb1 -bsp1": lines, with progress texts between them which 7z
// wipes by backspaces, blanks and backspaces before it goes on.
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

#endif  // DEVICE_ARCHIVER_PROGRESS_H_
