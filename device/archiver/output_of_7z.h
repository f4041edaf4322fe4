// What the stock 7z prints, and what it means. No I/O.
#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <string_view>
#include <utility>
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
  // Takes the next bytes, however they were cut, and returns what they complete. Throws Failure
  // when 7z finds the old archive damaged.
  std::vector<Event> Feed(const std::string& bytes);

 private:
  size_t TakeProgress(std::string_view line, std::vector<Event>* events);
  void TakeLine(const std::string& line, std::vector<Event>* events);

  std::string pending_;
  bool percent_seen_ = false;  // in the text that pending_ begins with
};

// What 7z said on standard error, boiled down to one line. 7z puts the cause, the object and the
// word "ERROR" on lines of their own, and only warns about a file that it leaves out.
class ErrorText {
 public:
  // Warnings about files that are left out on purpose are passed over.
  explicit ErrorText(std::set<std::string> left_out) : left_out_(std::move(left_out)) {}

  void Feed(const std::string& bytes);

  // A file is missing from the archive: nothing that 7z may still do can make it whole.
  bool HasWarning() const;
  bool HasPassedOver() const { return has_passed_over_; }
  bool Empty() const { return Line().empty(); }
  std::string Line() const;

 private:
  std::set<std::string> left_out_;
  std::string text_;
  bool has_passed_over_ = false;
};

}  // namespace Archiver
