// A path taken apart by basename and dirname.
#pragma once

#include <libgen.h>

#include <array>
#include <cstdio>
#include <string>

namespace Zantro {

inline constexpr std::size_t kPathBufferSize = 4096;  // bytes; a longer path is cut to fit

// Both texts lie in the object's own buffer: dirname ends the directory part there, before the
// name.
class SplitPath {
 public:
  explicit SplitPath(const std::string& path) {
    Print(path);
    name_ = basename(buffer_.data());
    Print(path);
    directory_ = dirname(buffer_.data());
  }
  SplitPath(const SplitPath&) = delete;
  SplitPath& operator=(const SplitPath&) = delete;

  const char* Name() const { return name_; }
  const char* Directory() const { return directory_; }

 private:
  void Print(const std::string& path) {
    std::snprintf(buffer_.data(), buffer_.size(), "%s", path.c_str());
  }

  std::array<char, kPathBufferSize> buffer_;
  const char* name_;
  const char* directory_;
};

}  // namespace Zantro
