// kavo-7z: the archiver of the device, on top of a stock 7z.
//
// It takes the device's switches (-utf16, -lang, -progress, empty arguments), and from the device
// what its caller cannot put there (base/archiver_call.h), reports to its caller in lines of its
// own, and keeps the promise that a file under the archive's name is a whole archive.

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <exception>
#include <fstream>
#include <iterator>
#include <limits>
#include <optional>
#include <set>
#include <utility>

#include "device/archiver/command_line.h"
#include "device/archiver/failure.h"
#include "device/archiver/job.h"
#include "device/archiver/link_free.h"
#include "device/archiver/list_file.h"
#include "device/archiver/old_archive.h"
#include "device/archiver/output_of_7z.h"
#include "device/archiver/program.h"
#include "device/archiver/report.h"
#include "device/archiver/special_files.h"
#include "device/archiver/switches.h"
#include "device/archiver/work_place.h"
#include "device/base/archiver_call.h"
#include "device/base/code_page.h"
#include "device/base/file_io.h"
#include "device/base/open_below.h"
#include "device/base/work_folder.h"

namespace Archiver {
namespace {

std::vector<std::string> Sources(const Request& request) {
  std::vector<std::string> sources =
      ReadSources(Device::ReadTextFile(request.list_path), request.list_path);
  if (std::all_of(sources.begin(), sources.end(),
                  [&](const std::string& source) { return IsExcluded(request, source); })) {
    throw NamedFailure("nothing to pack", sources.front(), "all sources are excluded");
  }
  for (const std::string& source : sources) {
    if (Device::IsWorkFolderName(source.substr(source.rfind('/') + 1))) {
      throw NamedFailure("cannot pack", source, "it has the name of a job's own folder");
    }
  }
  return sources;
}

template <typename IsWanted>
std::vector<std::string> Filter(const std::vector<std::string>& sources, IsWanted is_wanted) {
  std::vector<std::string> result;
  std::copy_if(sources.begin(), sources.end(), std::back_inserter(result), is_wanted);
  return result;
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

void ReportEvents(const std::vector<Event>& events, Report& report) {
  for (const Event& event : events) {
    switch (event.kind) {
      case Event::Kind::kFile:
        report.Compressing(event.name);
        break;
      case Event::Kind::kTotal:
        report.Total(event.value);
        break;
      case Event::Kind::kPercent:
        report.Progress(event.value);
        break;
    }
  }
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
  start.kept.insert(start.kept.end(), {sources.Get(), left_out.Get(), job.link_free});
  if (Device::Fence::IsSupported()) {
    start.environment = {"LD_PRELOAD=" + Device::PathOf(job.link_free)};
    if (run.follow_links) {
      start.environment.push_back(std::string(kStagedVariable) + "=1");
    }
  }
  OutputParser parser;
  try {
    Run7z(start, run.left_out_links, job.report,
          [&](const std::string& bytes) { ReportEvents(parser.Feed(bytes), job.report); });
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

std::vector<std::string> MemorySwitches(const Request& request, std::uint64_t memory,
                                        Report& report) {
  if (request.zip) {
    return {};  // takes little
  }
  const auto processors = static_cast<unsigned int>(sysconf(_SC_NPROCESSORS_ONLN));
  std::vector<std::string> switches = SwitchesWithin(memory, request.level, processors);
  std::string text;
  for (const std::string& each : switches) {
    text += " " + each;
  }
  if (!text.empty()) {
    report.Note(NameInError(request.archive) + ": within " + std::to_string(memory >> 20U) +
                " MiB of memory by" + text);
  }
  return switches;
}

// Packs what the request names and puts the archive in its place; returns it, opened as a path.
// What others do to names meanwhile can fail the job, and lead it nowhere else: everything is held
// by descriptor, and 7z reaches only the sources and its work folder. Throws Failure or Cancelled,
// with the old archive, if any, as it was.
Device::FileDescriptor PackArchive(const Request& request, const Device::ArchiverCall& call,
                                   Report& report) {
  CheckPassword(request);
  const bool recode = request.zip && !Device::CodePage::IsUtf8(request.code_page);
  if (recode && !Device::CodePage::Open(request.code_page)) {
    throw NamedFailure("unknown code page", request.code_page,
                       "not one for names in a zip archive");
  }
  std::vector<std::string> listed = Sources(request);
  const WorkPlace place = FindWorkPlace(listed, request.list_path);
  Job job(request, call, report);
  const Identities no_files = AllowSources(place, listed, job.fence);
  const std::vector<std::string> sources = WithoutNested(std::move(listed), no_files);
  const std::vector<std::string> suspects =
      Filter(sources, [&](const std::string& source) { return no_files.count(source) != 0; });

  PackRun run;
  run.sources = DivideNames(sources);
  run.memory = MemorySwitches(request, call.memory, report);
  PrepareArchive(job, run);
  const std::vector<std::string> left_out = NamesOf(place, job.target);
  if (place.shares.empty() && !request.zip) {  // a 7z archive has empty files without opening them
    run.left_out = DivideNames(left_out);
    Pack(job, run, place.folder);
  } else {
    PackWithSpecials(job, place, run, left_out, sources, suspects);
  }
  if (recode) {
    PutNamesIntoCodePage(job);
  }
  CheckIdentities(place, no_files);
  report.CheckCancelled();
  return job.target.Publish(job.work.Get());
}

// What the device tells beside the arguments; by hand it is not there.
std::optional<Device::ArchiverCall> CallOfDevice() {
  struct stat input {};
  if (fstat(STDIN_FILENO, &input) != 0 || !S_ISSOCK(input.st_mode)) {
    return std::nullopt;
  }
  return Device::ReceiveArchiverCall(STDIN_FILENO);
}

Device::ArchiverCall CallByHand() {
  return {{},
          Device::NewWorkFolderName(),
          Device::OpenBesideProgram(Device::kZipProgramName, O_PATH).Release(),
          Device::OpenBesideProgram(Device::kLinkFreeName, O_PATH).Release(),
          std::numeric_limits<std::uint64_t>::max(),
          {}};
}

// When memory runs out, it is this program and its 7z that the kernel kills.
void BeFirstToGo() { std::ofstream("/proc/self/oom_score_adj") << 1000 << std::flush; }

}  // namespace
}  // namespace Archiver

int main(int argc, char** argv) {
  if (fcntl(STDOUT_FILENO, F_GETFD) < 0) {
    return 1;  // nobody to report to
  }
  Device::OccupyStandardStreams();
  Archiver::BeFirstToGo();
  try {
    Archiver::Report report(STDOUT_FILENO);
    try {
      Archiver::Request request =
          Archiver::ParseCommandLine({argv + (argc > 0 ? 1 : 0), argv + argc});
      const std::optional<Device::ArchiverCall> of_device = Archiver::CallOfDevice();
      const Device::ArchiverCall call = of_device ? *of_device : Archiver::CallByHand();
      if (of_device) {
        request.password = call.password;
      }
      const Device::FileDescriptor archive = Archiver::PackArchive(request, call, report);
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
