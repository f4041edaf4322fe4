// Log lines of the whole program, the module's among them: where standard error is the system's
// journal, they go there with the task that they are about in the field TASK.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <sys/stat.h>
#include <syslog.h>
#include <systemd/sd-journal.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "device/cli/output.h"
#include "device/platform/host_services.h"

namespace {

bool IsJournal() {
  const char* const journal = std::getenv("JOURNAL_STREAM");
  struct stat status {};
  return journal != nullptr && fstat(STDERR_FILENO, &status) == 0 &&
         journal == std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

// The system's own.
void Pass(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  vsyslog(priority, format, arguments);
  va_end(arguments);
}

}  // namespace

// Called in place of libc's.
extern "C" void syslog(int priority, const char* format, ...) {
  va_list arguments;
  va_start(arguments, format);
  static const bool is_journal = IsJournal();
  char* text = nullptr;
  if (vasprintf(&text, format, arguments) >= 0) {
    // The name of somebody's file may hold what a terminal obeys, or what looks like another line.
    std::string line = text;
    if (!line.empty() && line.back() == '\n') {
      line.pop_back();
    }
    line = Device::Printable(line);
    const std::string& task = Device::TheHost().task;
    if (!is_journal) {
      Pass(priority, "%s", line.c_str());
    } else {
      sd_journal_send("MESSAGE=%s", line.c_str(), "PRIORITY=%d", LOG_PRI(priority),
                      "SYSLOG_IDENTIFIER=kavo-device", task.empty() ? nullptr : "TASK=%s",
                      task.c_str(), nullptr);
    }
    std::free(text);
  }
  va_end(arguments);
}
