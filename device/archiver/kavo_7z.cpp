// kavo-7z: the archiver of the device, on top of a stock 7z.
//
// It takes the device's switches (-utf16, -lang, -progress, empty arguments), and from the device
// what its caller cannot put there (base/archiver_call.h), reports to its caller in lines of its
// own, and keeps the promise that a file under the archive's name is a whole archive.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <exception>
#include <fstream>
#include <limits>
#include <optional>

#include "device/archiver/archive_job.h"
#include "device/archiver/cancel.h"
#include "device/archiver/command_line.h"
#include "device/archiver/failure.h"
#include "device/archiver/report.h"
#include "device/base/archiver_call.h"
#include "device/base/file_io.h"
#include "device/base/work_folder.h"

namespace {

constexpr char kZipProgram[] = "kavo-zip";

// What the device tells beside the arguments; by hand it is not there.
std::optional<Device::ArchiverCall> CallOfDevice() {
  struct stat input {};
  if (fstat(STDIN_FILENO, &input) != 0 || !S_ISSOCK(input.st_mode)) {
    return std::nullopt;
  }
  return Device::ReceiveArchiverCall(STDIN_FILENO);
}

Device::ArchiverCall CallByHand() {
  const int zip_program = Device::OpenBesideProgram(kZipProgram, O_PATH).Release();
  return {
      {}, Device::NewWorkFolderName(), zip_program, std::numeric_limits<std::uint64_t>::max(), {}};
}

// When memory runs out, it is this program and its 7z that the kernel kills.
void BeFirstToGo() { std::ofstream("/proc/self/oom_score_adj") << 1000 << std::flush; }

}  // namespace

int main(int argc, char** argv) {
  if (fcntl(STDOUT_FILENO, F_GETFD) < 0) {
    return 1;  // nobody to report to
  }
  Device::OccupyStandardStreams();
  BeFirstToGo();
  try {
    const Archiver::Cancel cancel(STDOUT_FILENO);
    Archiver::Report report(cancel);
    try {
      Archiver::Request request =
          Archiver::ParseCommandLine({argv + (argc > 0 ? 1 : 0), argv + argc});
      const std::optional<Device::ArchiverCall> of_device = CallOfDevice();
      const Device::ArchiverCall call = of_device ? *of_device : CallByHand();
      if (of_device) {
        request.password = call.password;
      }
      const Device::FileDescriptor archive = Archiver::PackArchive(request, call, cancel, report);
      if (of_device && !Device::SendMadeArchive(STDIN_FILENO, archive)) {
        return 1;  // nobody wants it any more
      }
      report.Done();
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
