// The file that tells the archiver what to pack.
#pragma once

#include <unistd.h>

#include <string>

namespace Zantro {

// Owns the file from the end of staging to the end of the archiver's run; one at a time in a
// process.
class ListFile {
 public:
  // Takes over the file of that path; an empty path is no file. The string must outlive the object.
  explicit ListFile(const std::string& path) { present_ = path.c_str(); }
  ~ListFile() { Remove(); }
  ListFile(const ListFile&) = delete;
  ListFile& operator=(const ListFile&) = delete;

  void Remove() {
    RemovePresent();
    present_ = "";
  }

  // Removes the file that has an owner now, if any; a signal handler may call it.
  static void RemovePresent() {
    if (*present_ != 0) {
      unlink(present_);
    }
  }

 private:
  static inline const char* volatile present_ = "";
};

}  // namespace Zantro
