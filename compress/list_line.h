// One line of the list that tells the archiver what to pack: "." and the entry's name, which begins
// with "/". No I/O.
#pragma once

#include <cstddef>
#include <cstdio>
#include <string>

namespace Zantro {

// Bytes of a line's buffer, with the terminating zero.
inline constexpr std::size_t kListLineSize = 4097;
inline constexpr std::size_t kStagedListLineSize = 4120;  // for names that begin with the share

// A name cannot be quoted in the list: bytes stand in it as the file system has them.
template <std::size_t kBufferSize>
class ListLine {
 public:
  explicit ListLine(const std::string& name)
      : length_(std::snprintf(text_, kBufferSize, ".%s\n", name.c_str())),
        is_expressible_(length_ > 0 && static_cast<std::size_t>(length_) < kBufferSize &&
                        name.find('\n') == std::string::npos) {}

  // False when the name does not fit the buffer, or holds a line feed, which ends a line.
  bool IsExpressible() const { return is_expressible_; }
  // The line, cut when it does not fit, with its terminating zero.
  const char* Text() const { return text_; }
  // Bytes of a line that is expressible, without that zero.
  int Length() const { return length_; }

 private:
  char text_[kBufferSize];
  int length_;
  bool is_expressible_;
};

}  // namespace Zantro
