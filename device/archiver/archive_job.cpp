#include "device/archiver/archive_job.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <iterator>
#include <memory>
#include <set>
#include <unordered_set>
#include <utility>

#include "device/archiver/code_page.h"
#include "device/archiver/failure.h"
#include "device/archiver/list_file.h"
#include "device/archiver/output_file.h"
#include "device/archiver/special_files.h"
#include "device/archiver/stock_7z.h"
#include "device/archiver/switches.h"
#include "device/archiver/work_place.h"
#include "device/archiver/zip_names.h"
#include "device/base/file_io.h"

namespace Archiver {
namespace {

constexpr mode_t kFileMode = 0666;  // the umask takes its share

Device::FileDescriptor Open(const std::string& path, int flags) {
  Device::FileDescriptor fd(open(path.c_str(), flags | O_CLOEXEC, kFileMode));
  if (!fd) {
    throw SystemFailure("cannot open", path, errno);
  }
  return fd;
}

void CopyFile(const std::string& from, const std::string& to, const Cancel& cancel) {
  const Device::FileDescriptor in = Open(from, O_RDONLY);
  const Device::FileDescriptor out = Open(to, O_WRONLY | O_CREAT | O_EXCL);
  std::array<char, 65536> block{};
  while (const ssize_t size = read(in.Get(), block.data(), block.size())) {
    cancel.Check();
    if (size < 0) {
      throw SystemFailure("cannot read", from, errno);
    }
    if (!Device::WriteAll(out.Get(), {block.data(), static_cast<size_t>(size)})) {
      throw SystemFailure("cannot write", to, errno);
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

void Pack(const Request& request, PackRun run, const std::string& folder, const Cancel& cancel,
          Report& report) {
  const Device::FileDescriptor sources = UnnamedFile(run.sources.list);
  const Device::FileDescriptor left_out = UnnamedFile(run.left_out.list);
  const Device::FileDescriptor password = PasswordInput(request);
  run.sources_file = "/proc/self/fd/" + std::to_string(sources.Get());
  run.left_out_file = "/proc/self/fd/" + std::to_string(left_out.Get());
  Device::ProgramStart start;
  start.program = kStock7z;
  start.arguments = SwitchesFor7z(request, run);
  start.arguments.insert(start.arguments.begin(), kStock7z);
  start.folder = folder;
  start.input = password.Get();
  start.kept = {sources.Get(), left_out.Get()};
  Run7z(start, run.left_out_links, cancel, report);
}

// The special files are left out of the main run and then added from harmless copies of them, so
// that links end as links and the rest as empty files, as they do when 7z meets them on its own.
// `suspects` are the sources that can be special or have some below them; the run names all
// sources.
void PackWithSpecials(const Request& request, PackRun run, std::vector<std::string> left_out,
                      const std::vector<std::string>& sources,
                      const std::vector<std::string>& suspects, const WorkPlace& place,
                      const Cancel& cancel, Report& report) {
  const std::vector<std::string> specials = FindSpecials(place, suspects, request.exclude);
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
    Pack(request, run, place.folder, cancel, report);
    if (run.follow_links && FindSpecials(place, sources, request.exclude) != specials) {
      throw Failure("symbolic links changed while they were packed");
    }
    run.archive = run.new_archive.empty() ? run.archive : run.new_archive;
    run.new_archive.clear();
  }
  if (!specials.empty()) {
    const SpecialsMirror mirror(place, specials);
    run.sources = DivideNames(specials);
    run.left_out = {};
    run.follow_links = false;
    run.left_out_links.clear();
    Pack(request, run, mirror.Path(), cancel, report);
  }
}

}  // namespace

void PackArchive(const Request& request, const Cancel& cancel, Report& report) {
  CheckPassword(request);
  const bool recode = request.zip && !CodePage::IsUtf8(request.code_page);
  const auto page = recode ? std::make_unique<CodePage>(request.code_page) : nullptr;
  std::vector<std::string> listed = Sources(request);
  const WorkPlace place = FindWorkPlace(listed, request.list_path);
  const std::unordered_set<std::string> no_files = CheckSources(place, listed);
  const std::vector<std::string> sources = WithoutNested(std::move(listed), no_files);
  const std::vector<std::string> suspects =
      Filter(sources, [&](const std::string& source) { return no_files.count(source) != 0; });
  const ArchiveState seen = LookAtArchive(request.archive);
  const WorkFolder work(request.archive);

  PackRun run;
  run.archive = work.Result();
  run.sources = DivideNames(sources);
  if (seen.exists && page && HasNamesIn(*page, request.archive)) {
    CopyFile(request.archive, work.Result(), cancel);
    NamesToUtf8(*page, work.Result(), cancel);
  } else if (seen.exists) {
    run.archive = request.archive;
    run.new_archive = work.Result();
  }
  std::vector<std::string> left_out = NamesWithin(place, request.archive);
  const std::vector<std::string> own = NamesWithin(place, work.Path());
  left_out.insert(left_out.end(), own.begin(), own.end());
  if (place.shares.empty() && !request.zip) {  // a 7z archive has empty files without opening them
    run.left_out = DivideNames(left_out);
    Pack(request, run, place.folder, cancel, report);
  } else {
    PackWithSpecials(request, run, left_out, sources, suspects, place, cancel, report);
  }
  if (page) {
    NamesToCodePage(*page, work.Result(), cancel);
  }
  cancel.Check();
  work.Publish(seen);
  report.Done();
}

}  // namespace Archiver
