// The lines that the archiver prints, and what they mean. No I/O.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace Zantro {

// Why the archiver gave up, as far as its error line tells.
enum class ArchiverError { kNoSpace, kQuota, kReadOnly, kNameTooLong, kUnknown };

struct ArchiverEvent {
  enum Kind { kTotal, kFile, kProgress, kError, kOther };

  Kind kind = kOther;
  std::uint64_t total_size = 0;  // kTotal: bytes
  std::string file;              // kFile: the last character of the line alone, never the name
  float progress = 0;            // kProgress: 0 to 1
  ArchiverError error = ArchiverError::kUnknown;
};

// `line` is one line with its line feed, which the last one may lack; a zero byte stands behind it,
// as getline leaves it. Throws std::out_of_range for a "Compressing " line with nothing behind it,
// not even a line feed.
ArchiverEvent ParseArchiverLine(std::string_view line);

}  // namespace Zantro
