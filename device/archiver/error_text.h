#ifndef DEVICE_ARCHIVER_ERROR_TEXT_H_
#define DEVICE_ARCHIVER_ERROR_TEXT_H_

#include <string>

namespace Archiver {

// What 7z said on standard error, boiled down to one line. 7z puts the cause, the object and the
// word "ERROR" on lines of their own, and only warns about a file that it leaves out.
class ErrorText {
 public:
  void Feed(const std::string& bytes);

  // A file is missing from the archive: nothing that 7z may still do can make it whole.
  bool HasWarning() const;
  bool Empty() const { return Line().empty(); }
  std::string Line() const;

 private:
  std::string text_;
};

}  // namespace Archiver

#endif  // DEVICE_ARCHIVER_ERROR_TEXT_H_
