#include "device/archiver/job.h"

#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>
#include <utility>

#include "device/archiver/failure.h"
#include "device/base/file_io.h"
#include "device/base/open_below.h"

namespace Archiver {
namespace {

Device::WorkFolder MakeWorkFolder(const Target& target, const std::string& name) {
  try {
    return Device::WorkFolder(target.Folder(), name);
  } catch (const std::system_error& error) {
    throw SystemFailure("cannot make a temporary folder beside", target.Path(),
                        error.code().value());
  }
}

}  // namespace

Job::Job(const Request& asked, const Device::ArchiverCall& call, Report& lines)
    : request(asked),
      report(lines),
      target(asked.archive, call.fixed_folders),
      work(MakeWorkFolder(target, call.work_folder)),
      zip_program(call.zip_program),
      link_free(call.link_free) {
  fence.AllowWriting(work.Get());
  fence.AllowRunning(zip_program);
  fence.AllowRunning(link_free);
  if (target.Old()) {
    fence.AllowReading(target.Old().Get());
  }
}

std::string Job::Result() const { return Device::PathOf(work.Get()) + "/" + Device::kWorkResult; }

std::string Job::Old() const { return Device::PathOf(target.Old().Get()); }

Device::ProgramStart ProgramOf(const Job& job) {
  Device::ProgramStart start;
  start.folder = job.work.Get();
  start.kept = {job.work.Get()};
  if (job.target.Old()) {
    start.kept.push_back(job.target.Old().Get());
  }
  start.fence = &job.fence;
  return start;
}

Device::FileDescriptor UnnamedFile(const std::string& text) {
  Device::FileDescriptor fd(memfd_create("kavo-7z", MFD_CLOEXEC));
  if (!fd || !Device::WriteAll(fd.Get(), text) || lseek(fd.Get(), 0, SEEK_SET) != 0) {
    throw SystemFailure("cannot write", "unnamed file for 7z", errno);
  }
  return fd;
}

Device::FileDescriptor PasswordInput(const Request& request) {
  if (request.password.empty()) {
    return Device::FileDescriptor();
  }
  // It asks once to open an old archive and once to encrypt new files.
  const std::string answers = request.password + '\n' + request.password + '\n';
  constexpr size_t kPipeBytes = 65536;
  if (answers.size() > kPipeBytes) {
    throw Failure("the password is too long");
  }
  Device::Pipe pipe;
  if (!Device::WriteAll(pipe.writer.Get(), answers)) {
    throw SystemFailure("cannot write", "the password for 7z", errno);
  }
  return std::move(pipe.reader);
}

}  // namespace Archiver
