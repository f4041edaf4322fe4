#pragma once

#include <set>
#include <string>
#include <utility>

namespace Archiver {

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
