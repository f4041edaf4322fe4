#include "device/archiver/archive_job.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <iterator>
#include <set>
#include <unordered_set>
#include <utility>

#include "device/archiver/failure.h"
#include "device/archiver/list_file.h"
#include "device/archiver/special_files.h"
#include "device/archiver/stock_7z.h"
#include "device/archiver/switches.h"
#include "device/archiver/target.h"
#include "device/archiver/work_place.h"
#include "device/archiver/zip_program.h"
#include "device/base/code_page.h"
#include "device/base/fence.h"
#include "device/base/file_io.h"
#include "device/base/open_below.h"
#include "device/base/work_folder.h"

namespace Archiver {
namespace {

constexpr mode_t kFileMode = 0666;  // the umask takes its share

Device::WorkFolder MakeWorkFolder(const Target& target, const std::string& name) {
  try {
    return Device::WorkFolder(target.Folder(), name);
  } catch (const std::system_error& error) {
    throw SystemFailure("cannot make a temporary folder beside", target.Path(),
                        error.code().value());
  }
}

// A job while it runs: what it holds, and what the programs that it starts may reach.
struct Job {
  Job(const Request& asked, const Device::ArchiverCall& call, const Cancel& stop, Report& lines)
      : request(asked),
        cancel(stop),
        report(lines),
        target(asked.archive, call.fixed_folders),
        work(MakeWorkFolder(target, call.work_folder)),
        zip_program(call.zip_program) {
    fence.AllowWriting(work.Get());
    fence.AllowRunning(zip_program);
    if (target.Old()) {
      fence.AllowReading(target.Old().Get());
    }
  }

  // The new archive, as the programs know it.
  std::string Result() const { return Device::PathOf(work.Get()) + "/" + Device::kWorkResult; }
  std::string Old() const { return Device::PathOf(target.Old().Get()); }

  const Request& request;
  const Cancel& cancel;
  Report& report;
  const Target target;
  const Device::WorkFolder work;
  const int zip_program;
  Device::Fence fence;
};

// A program of the job's, as far as all are alike.
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

Device::FileDescriptor Open(const std::string& path, int flags) {
  Device::FileDescriptor fd(open(path.c_str(), flags | O_CLOEXEC, kFileMode));
  if (!fd) {
    throw SystemFailure("cannot open", path, errno);
  }
  return fd;
}

void CopyOldArchive(const Job& job) {
  const std::string& name = job.target.Path();
  const Device::FileDescriptor in = Open(job.Old(), O_RDONLY);
  const Device::FileDescriptor out = Open(job.Result(), O_WRONLY | O_CREAT | O_EXCL);
  std::array<char, 65536> block{};
  while (const ssize_t size = read(in.Get(), block.data(), block.size())) {
    job.cancel.Check();
    if (size < 0) {
      throw SystemFailure("cannot read", name, errno);
    }
    if (!Device::WriteAll(out.Get(), {block.data(), static_cast<size_t>(size)})) {
      throw SystemFailure("cannot write a copy of", name, errno);
    }
  }
}

std::vector<std::string> Sources(const Request& request) {
  std::vector<std::string> sources =
      ReadSources(Device::ReadTextFile(request.list_path), request.list_path);
  if (std::all_of(sources.begin(), sources.end(),
                  [&](const std::string& source) { return IsExcluded(request, source); })) {
    throw NamedFailure("nothing to pack", sources.front(), "all sources are excluded");
  }
  return sources;
}

template <typename IsWanted>
std::vector<std::string> Filter(const std::vector<std::string>& sources, IsWanted is_wanted) {
  std::vector<std::string> result;
  std::copy_if(sources.begin(), sources.end(), std::back_inserter(result), is_wanted);
  return result;
}

// An unnamed file that holds the text, positioned at its start.
Device::FileDescriptor UnnamedFile(const std::string& text) {
  Device::FileDescriptor fd(memfd_create("kavo-7z", MFD_CLOEXEC));
  if (!fd || !Device::WriteAll(fd.Get(), text) || lseek(fd.Get(), 0, SEEK_SET) != 0) {
    throw SystemFailure("cannot write", "unnamed file for 7z", errno);
  }
  return fd;
}

// A standard input for 7z that answers its questions for the password; invalid when there is none.
Device::FileDescriptor PasswordInput(const Request& request) {
  if (request.password.empty()) {
    return Device::FileDescriptor();
  }
  // It asks once to open an old archive and once to encrypt new files.
  const std::string answer = request.password + '\n';
  return UnnamedFile(answer + answer);
}

// What kavo-zip says of an archive, or does with it; see there.
bool RunZip(const Job& job, const std::string& command, const std::string& archive) {
  const Device::FileDescriptor password = UnnamedFile(job.request.password);
  Device::ProgramStart start = ProgramOf(job);
  start.program = Device::PathOf(job.zip_program);
  start.arguments = {"kavo-zip", command, archive, job.request.code_page};
  start.input = password.Get();
  return RunZipProgram(start, job.target.Path(), job.cancel);
}

// 7z knows the archives by their descriptors alone; whoever reads an error knows the name.
std::string WithArchiveNamed(std::string text, const PackRun& run, const std::string& name) {
  for (const std::string& path : {run.new_archive, run.archive}) {
    for (size_t at = 0; !path.empty() && (at = text.find(path)) != std::string::npos;) {
      text.replace(at, path.size(), NameInError(name));
    }
  }
  return text;
}

void Pack(Job& job, PackRun run, const Device::FileDescriptor& folder) {
  const Device::FileDescriptor sources = UnnamedFile(run.sources.list);
  const Device::FileDescriptor left_out = UnnamedFile(run.left_out.list);
  const Device::FileDescriptor password = PasswordInput(job.request);
  run.sources_file = Device::PathOf(sources.Get());
  run.left_out_file = Device::PathOf(left_out.Get());
  Device::ProgramStart start = ProgramOf(job);
  start.program = kStock7z;
  start.arguments = SwitchesFor7z(job.request, run);
  start.arguments.insert(start.arguments.begin(), kStock7z);
  start.folder = folder.Get();
  start.input = password.Get();
  start.kept.insert(start.kept.end(), {sources.Get(), left_out.Get()});
  try {
    Run7z(start, run.left_out_links, job.cancel, job.report);
  } catch (const Failure& failure) {
    throw Failure(WithArchiveNamed(failure.what(), run, job.target.Path()));
  }
}

// The special files are left out of the main run and then added from harmless copies of them, so
// that links end as links and the rest as empty files, as they do when 7z meets them on its own.
// `suspects` are the sources that can be special or have some below them; the run names all
// sources.
void PackWithSpecials(Job& job, const WorkPlace& place, PackRun run,
                      std::vector<std::string> left_out, const std::vector<std::string>& sources,
                      const std::vector<std::string>& suspects) {
  const std::vector<std::string>& excluded = job.request.exclude;
  const std::vector<std::string> specials = FindSpecials(place, suspects, excluded);
  const std::set<std::string> known(specials.begin(), specials.end());
  if (!specials.empty()) {
    run.sources = DivideNames(
        Filter(sources, [&](const std::string& source) { return known.count(source) == 0; }));
  }
  if (!run.sources.IsEmpty()) {
    left_out.insert(left_out.end(), specials.begin(), specials.end());
    run.left_out = DivideNames(left_out);
    run.follow_links = !place.shares.empty();
    run.left_out_links = known;
    Pack(job, run, place.folder);
    if (run.follow_links && FindSpecials(place, sources, excluded) != specials) {
      throw Failure("symbolic links changed while they were packed");
    }
    run.archive = run.new_archive.empty() ? run.archive : run.new_archive;
    run.new_archive.clear();
  }
  if (!specials.empty()) {
    run.sources = DivideNames(specials);
    run.left_out = {};
    run.follow_links = false;
    run.left_out_links.clear();
    Pack(job, run, MirrorSpecials(place, specials, job.work.Get()));
  }
}

// What 7z is to begin with: nothing, the archive that stands there, or, where names in it have to
// be changed first, a copy of it.
void PrepareArchive(Job& job, PackRun& run) {
  run.archive = job.Result();
  if (!job.target.Old()) {
    return;
  }
  if (job.request.zip && !RunZip(job, kZipCheck, job.Old())) {
    CopyOldArchive(job);
    RunZip(job, kZipToUtf8, job.Result());
  } else {
    run.archive = job.Old();
    run.new_archive = job.Result();
  }
}

}  // namespace

Device::FileDescriptor PackArchive(const Request& request, const Device::ArchiverCall& call,
                                   const Cancel& cancel, Report& report) {
  CheckPassword(request);
  const bool recode = request.zip && !Device::CodePage::IsUtf8(request.code_page);
  if (recode && !Device::CodePage::Open(request.code_page)) {
    throw NamedFailure("unknown code page", request.code_page,
                       "not one for names in a zip archive");
  }
  std::vector<std::string> listed = Sources(request);
  const WorkPlace place = FindWorkPlace(listed, request.list_path);
  Job job(request, call, cancel, report);
  const std::unordered_set<std::string> no_files = AllowSources(place, listed, job.fence);
  const std::vector<std::string> sources = WithoutNested(std::move(listed), no_files);
  const std::vector<std::string> suspects =
      Filter(sources, [&](const std::string& source) { return no_files.count(source) != 0; });

  PackRun run;
  run.sources = DivideNames(sources);
  PrepareArchive(job, run);
  const std::vector<std::string> left_out = NamesOf(place, job.target);
  if (place.shares.empty() && !request.zip) {  // a 7z archive has empty files without opening them
    run.left_out = DivideNames(left_out);
    Pack(job, run, place.folder);
  } else {
    PackWithSpecials(job, place, run, left_out, sources, suspects);
  }
  if (recode) {
    RunZip(job, kZipToCodePage, job.Result());
  }
  cancel.Check();
  return job.target.Publish(job.work.Get());
}

}  // namespace Archiver
