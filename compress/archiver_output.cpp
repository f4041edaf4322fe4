#include "compress/archiver_output.h"

#include <cstdlib>

namespace Zantro {

namespace {

constexpr char kTotalPrefix[] = "Total: ";
constexpr char kFilePrefix[] = "Compressing ";
constexpr char kProgressPrefix[] = "Progress: ";
constexpr char kErrorMark[] = "Error:";

struct ErrorText {
  const char* text;
  ArchiverError error;
};
// In this order: a line that names two causes has the first.
constexpr ErrorText kErrorTexts[] = {
    {"No space left on device", ArchiverError::kNoSpace},
    {"Disk quota exceeded", ArchiverError::kQuota},
    {"Read-only file system", ArchiverError::kReadOnly},
    {"File name too long", ArchiverError::kNameTooLong},
};

// What follows the prefix, null when the line does not begin with it.
template <std::size_t kSize>
const char* AfterPrefix(std::string_view line, const char (&prefix)[kSize]) {
  constexpr std::size_t kLength = kSize - 1;
  return line.compare(0, kLength, prefix) == 0 ? line.data() + kLength : nullptr;
}

ArchiverError FindError(std::string_view line) {
  for (const ErrorText& row : kErrorTexts) {
    if (line.find(row.text) != std::string::npos) {
      return row.error;
    }
  }
  return ArchiverError::kUnknown;
}

}  // namespace

ArchiverEvent ParseArchiverLine(std::string_view line) {
  constexpr int kDecimal = 10;
  ArchiverEvent event;
  if (const char* size = AfterPrefix(line, kTotalPrefix)) {
    event.kind = ArchiverEvent::kTotal;
    event.total_size = static_cast<std::uint64_t>(std::strtoll(size, nullptr, kDecimal));
  } else if (AfterPrefix(line, kFilePrefix) != nullptr) {
    event.kind = ArchiverEvent::kFile;
    const std::string name(line.substr(sizeof(kFilePrefix) - 1));
    // The last character alone, the line feed, which is all that the task's readers know. Without
    // one this throws.
    event.file = name.substr(name.length() - 1);
  } else if (const char* percent = AfterPrefix(line, kProgressPrefix)) {
    event.kind = ArchiverEvent::kProgress;
    event.progress = static_cast<float>(std::strtol(percent, nullptr, kDecimal)) / 100.0F;
  } else if (line.find(kErrorMark) != std::string::npos) {
    event.kind = ArchiverEvent::kError;
    event.error = FindError(line);
  }
  return event;
}

}  // namespace Zantro
