// kavo-7z: the archiver of the device, on top of a stock 7z.
//
// It takes the device's switches (-utf16, -lang, -progress, empty arguments), reports to its caller
// in lines of its own, and keeps the promise that a file under the archive's name is a whole
// archive.

#include <fcntl.h>
#include <unistd.h>

#include <exception>
#include <string>
#include <vector>

#include "device/archiver/archive_job.h"
#include "device/archiver/cancel.h"
#include "device/archiver/command_line.h"
#include "device/archiver/failure.h"
#include "device/archiver/report.h"

namespace {

// Keeps the files that this program opens off the numbers of standard streams it was started
// without.
void OccupyStandardStreams() {
  int fd = 0;
  do {
    fd = open("/dev/null", O_RDWR | O_CLOEXEC);
  } while (fd >= 0 && fd <= STDERR_FILENO);
  close(fd);
}

}  // namespace

int main(int argc, char** argv) {
  const std::vector<std::string> arguments(argv + (argc > 0 ? 1 : 0), argv + argc);
  Archiver::HidePassword(argc, argv);
  if (fcntl(STDOUT_FILENO, F_GETFD) < 0) {
    return 1;  // nobody to report to
  }
  OccupyStandardStreams();
  try {
    const Archiver::Cancel cancel(STDOUT_FILENO);
    Archiver::Report report(cancel);
    try {
      Archiver::PackArchive(Archiver::ParseCommandLine(arguments), cancel, report);
      return 0;
    } catch (const Archiver::Cancelled&) {
      report.CancelledRun();
    } catch (const std::exception& error) {
      report.Error(error.what());
    }
  } catch (const std::exception&) {
    // There is nobody left to tell.
  }
  return 1;
}
