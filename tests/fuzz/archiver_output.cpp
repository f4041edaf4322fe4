// The archiver's output, as the worker reads it line by line.
#include "compress/archiver_output.h"

#include <cmath>

#include "tests/fuzz/targets.h"

using Event = Zantro::ArchiverEvent;

namespace {

void CheckLine(const std::string& line) try {
  const Event event = Zantro::ParseArchiverLine(line);
  const Event::Kind kind = line.rfind("Total: ", 0) == 0        ? Event::kTotal
                           : line.rfind("Compressing ", 0) == 0 ? Event::kFile
                           : line.rfind("Progress: ", 0) == 0   ? Event::kProgress
                           : line.find("Error:") != line.npos   ? Event::kError
                                                                : Event::kOther;
  Require(event.kind == kind, "an error is a line with the mark and without a prefix");
  Require(event.file.size() == (kind == Event::kFile ? 1 : 0), "a file is one character");
  Require(std::isfinite(event.progress), "progress is finite");
  Require((event.error == Zantro::ArchiverError::kNoSpace) ==
              (kind == Event::kError && line.find("No space left on device") != line.npos),
          "the first cause counts, in error lines alone");
} catch (const std::out_of_range&) {
  Require(line == "Compressing ", "only a file line without a name is refused");
}

}  // namespace

void FuzzArchiverOutput(const std::string& input) {
  std::vector<std::string> lines = SplitAt('\n', input);
  for (std::size_t line = 0; line + 1 < lines.size(); ++line) {
    CheckLine(lines[line] + "\n");
  }
  CheckLine(lines.back());
}
