#include "device/archiver/old_archive.h"

#include <fcntl.h>
#include <sys/sendfile.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "device/archiver/failure.h"
#include "device/archiver/program.h"
#include "device/archiver/zip_program.h"
#include "device/base/open_below.h"

namespace Archiver {
namespace {

constexpr char kCannotUpdate[] = "cannot update archive";
constexpr mode_t kFileMode = 0666;  // the umask takes its share

Device::FileDescriptor Open(const std::string& path, int flags) {
  Device::FileDescriptor fd(open(path.c_str(), flags | O_CLOEXEC, kFileMode));
  if (!fd) {
    throw SystemFailure("cannot open", path, errno);
  }
  return fd;
}

void CopyOldArchive(const Job& job) {
  const Device::FileDescriptor in = Open(job.Old(), O_RDONLY);
  const Device::FileDescriptor out = Open(job.Result(), O_WRONLY | O_CREAT | O_EXCL);
  constexpr size_t kAtOnce = 1 << 20;
  while (const ssize_t sent = sendfile(out.Get(), in.Get(), nullptr, kAtOnce)) {
    job.report.CheckCancelled();
    if (sent < 0) {
      throw SystemFailure("cannot write a copy of", job.target.Path(), errno);
    }
  }
}

// What kavo-zip says of an archive, or does with it; see there. True for kZipYes.
bool RunZip(const Job& job, const std::string& command, const std::string& archive) {
  const Device::FileDescriptor password = UnnamedFile(job.request.password);
  Device::ProgramStart start = ProgramOf(job);
  start.program = Device::PathOf(job.zip_program);
  start.arguments = {Device::kZipProgramName, command, archive, job.request.code_page};
  start.input = password.Get();
  std::string reason;
  const int status = RunProgram(
      start, job.report, [](const std::string& /*none*/) {},
      [&](const std::string& bytes) { reason += bytes; });
  if (!WIFEXITED(status) || (WEXITSTATUS(status) != kZipYes && WEXITSTATUS(status) != kZipNo)) {
    throw NamedFailure(kCannotUpdate, job.target.Path(),
                       reason.empty() ? "kavo-zip failed" : reason);
  }
  return WEXITSTATUS(status) == kZipYes;
}

// Has 7z do that with the old archive, of type 7z, and returns what it prints.
std::string AskAboutOld7z(const Job& job, const char* command) {
  const Device::FileDescriptor password = PasswordInput(job.request);
  Device::ProgramStart start = ProgramOf(job);
  start.program = kStock7z;
  start.arguments = {kStock7z, command, "-t7z", "-slt", "-bsp0", job.Old()};
  start.input = password.Get();
  std::string output;
  Run7z(start, {}, job.report, [&](const std::string& bytes) { output += bytes; });
  return output;
}

void CheckOld7z(const Job& job) {
  const bool is_protected = AskAboutOld7z(job, "l").find("\nEncrypted = +\n") != std::string::npos;
  if (is_protected && job.request.password.empty()) {
    throw NamedFailure(kCannotUpdate, job.target.Path(),
                       "it is protected by a password, and none is given");
  }
  if (is_protected) {
    try {
      AskAboutOld7z(job, "t");
    } catch (const Failure& failure) {
      throw NamedFailure(kCannotUpdate, job.target.Path(),
                         std::string("it is protected by another password: ") + failure.what());
    }
  }
}

}  // namespace

void PrepareArchive(const Job& job, PackRun& run) {
  run.archive = job.Result();
  if (!job.target.Old()) {
    return;
  }
  if (job.request.zip && !RunZip(job, kZipCheck, job.Old())) {
    CopyOldArchive(job);
    RunZip(job, kZipToUtf8, job.Result());
    return;
  }
  if (!job.request.zip) {
    CheckOld7z(job);
  }
  run.archive = job.Old();
  run.new_archive = job.Result();
}

void PutNamesIntoCodePage(const Job& job) { RunZip(job, kZipToCodePage, job.Result()); }

}  // namespace Archiver
