#include "device/archiver/stock_7z.h"

#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "device/archiver/failure.h"
#include "device/archiver/output_of_7z.h"

namespace Archiver {

const char* const kStock7z = KAVO_STOCK_7Z;

namespace {

constexpr int kWarned = 1;  // its exit status

// The caller's, with a locale under which 7z takes names for UTF-8 and speaks English. With the
// zone that holds anyway, but named, the C library does not look at its file again for each time
// of each source that 7z converts.
std::vector<std::string> Environment() {
  std::vector<std::string> result;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    if (std::strncmp(*entry, "LC_", 3) != 0 && std::strncmp(*entry, "LANG", 4) != 0) {
      result.emplace_back(*entry);
    }
  }
  result.emplace_back("LC_ALL=C.UTF-8");
  if (std::getenv("TZ") == nullptr) {
    result.emplace_back("TZ=:/etc/localtime");
  }
  return result;
}

}  // namespace

void Run7z(Device::ProgramStart start, const std::set<std::string>& left_out, const Cancel& cancel,
           const OutputReader& reader) {
  start.environment = Environment();
  ErrorText text(left_out);
  const int status = RunProgram(std::move(start), cancel, reader, [&](const std::string& bytes) {
    text.Feed(bytes);
    if (text.HasWarning()) {
      throw Failure("not everything can be packed: " + text.Line());
    }
  });
  if (WIFEXITED(status) && WEXITSTATUS(status) <= (text.HasPassedOver() ? kWarned : 0) &&
      text.Empty()) {
    return;
  }
  const std::string end =
      WIFSIGNALED(status) ? "7z was killed by signal " + std::to_string(WTERMSIG(status)) +
                                (WTERMSIG(status) == SIGKILL ? ", maybe for want of memory" : "")
                          : "7z failed with status " + std::to_string(WEXITSTATUS(status));
  throw Failure(text.Empty() ? end : end + ": " + text.Line());
}

}  // namespace Archiver
