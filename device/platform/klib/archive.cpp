#include "device/platform/klib/archive.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <filesystem>
#include <stdexcept>
#include <utility>

#include "device/base/archiver_call.h"
#include "device/base/open_below.h"
#include "device/base/try_or_log.h"
#include "device/base/work_folder.h"
#include "device/model/device.h"
#include "device/platform/lumo/identity.h"
#include "device/platform/lumo/paths.h"
#include "device/tasks/job_queue.h"
#include "device/tasks/task_store.h"

namespace Device {

namespace {

struct {
  std::string path;
  FileDescriptor file;
} the_archive;

FileDescriptor OpenSingleFile(const std::string& path) {
  FileDescriptor file = OpenUserPath(TheDevice().FixedFolders(CurrentUser()), path, O_PATH);
  struct stat status {};
  const bool is_single =
      file && fstat(file.Get(), &status) == 0 && S_ISREG(status.st_mode) && status.st_nlink == 1;
  return is_single ? std::move(file) : FileDescriptor();
}

bool IsSameFolder(const FileDescriptor& folder) {
  std::error_code ignored;
  return folder && std::filesystem::equivalent(PathOf(folder.Get()), ".", ignored);
}

// The module's vector, taken apart.
struct Arguments {
  std::vector<std::string> shown;  // all but the password, with the program's name in front
  std::string password;
  std::string list;     // path
  std::string archive;  // path
};

// A last "-progress" is the switch; anywhere else it would be the password "rogress".
Arguments TakeApart(char* const* argument) {
  constexpr char kPasswordMark[] = "-p";
  constexpr std::size_t kMarkLength = sizeof kPasswordMark - 1;
  Arguments taken;
  taken.shown = {*argument};
  while (*++argument != nullptr) {
    const std::string text = *argument;
    if (text.compare(0, kMarkLength, kPasswordMark) == 0 && argument[1] != nullptr) {
      taken.password = text.substr(kMarkLength);
      continue;
    }
    if (text[0] == '@') {
      taken.list = text.substr(1);
    } else if (text[0] == '/') {
      taken.archive = text;
    }
    taken.shown.push_back(text);
  }
  return taken;
}

// So that it is removed when this worker and its archiver are killed.
void NoteWhatIsLeft(const Arguments& arguments, const std::string& work_folder) {
  const std::string& archive = arguments.archive;
  TryOrLog("archiver", [&] {
    StoreOf(CurrentUser())
        .AddLeftovers(
            {0, getpid(), arguments.list, archive.substr(0, archive.rfind('/')), work_folder});
  });
}

}  // namespace

Json::Value& TheArchiverNews() {
  static Json::Value news(Json::objectValue);
  return news;
}

void TakeArchiverLine(const std::string& line) {
  static const std::string kFile = "Compressing ";
  static const std::string kError = "Error: ";
  static const std::string kNote = "Note: ";
  Json::Value& news = TheArchiverNews();
  if (line.rfind(kFile, 0) == 0) {
    news[kArchiverFile] = line.substr(kFile.size());
  } else if (line.rfind(kError, 0) == 0 && !news.isMember(kArchiverReason)) {
    news[kArchiverReason] = line.substr(kError.size());  // what follows says less
  } else if (line.rfind(kNote, 0) == 0) {
    syslog(LOG_NOTICE, "%s", line.substr(kNote.size()).c_str());
  }
}

ChildProcess StartArchiver(char* const* argument_vector, int output, ArchiverRun& run) {
  const Arguments arguments = TakeApart(argument_vector);
  const ArchiverCall call = {
      arguments.password,          NewWorkFolderName(), TheDevice().zip_program.Get(),
      TheDevice().link_free.Get(), MemoryOfJob(),       TheDevice().FixedFolders(CurrentUser())};
  const std::string& folder = SourcesFolder();
  if (!folder.empty() &&
      !IsSameFolder(OpenUserPath(call.fixed_folders, folder, O_PATH | O_DIRECTORY))) {
    throw std::runtime_error("the folder of the sources has changed: " + folder);
  }
  if (!Fence::IsSupported()) {
    syslog(LOG_WARNING, "the archiver is not fenced: the kernel has no Landlock");
  }
  int ends[2];
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
    ThrowErrno("socket pair");
  }
  run = {FileDescriptor(ends[0]), arguments.archive};
  the_archive = {run.archive, OpenSingleFile(run.archive)};
  const FileDescriptor input(ends[1]);
  NoteWhatIsLeft(arguments, call.work_folder);
  if (!SendArchiverCall(run.call.Get(), call)) {
    ThrowErrno("archiver");
  }
  ProgramStart start;
  start.program = PathOf(TheDevice().archiver.Get());
  start.arguments = arguments.shown;
  start.input = input.Get();
  start.output = output;
  start.kept = {call.zip_program, call.link_free};
  return ChildProcess::Start(start);
}

void TakeArchive(const ArchiverRun& run) {
  if (FileDescriptor made = ReceiveMadeArchive(run.call.Get())) {
    struct stat status {};
    if (fstat(made.Get(), &status) == 0) {
      TheArchiverNews()[kArchiverSize] = Json::UInt64(status.st_size);
    }
    the_archive = {run.archive, std::move(made)};
  }
}

FileDescriptor OpenArchive(const std::string& path) {
  if (path != the_archive.path) {
    return OpenSingleFile(path);
  }
  return FileDescriptor(fcntl(the_archive.file.Get(), F_DUPFD_CLOEXEC, 0));
}

}  // namespace Device
