#include "device/archiver/switches.h"

#include <algorithm>

#include "device/base/work_folder.h"

namespace Archiver {
namespace {

void AddNames(const std::string& mark, const NamesFor7z& names, const std::string& file,
              std::vector<std::string>* switches) {
  if (!names.list.empty()) {
    switches->push_back(mark + "@" + file);
  }
  for (const std::string& name : names.arguments) {
    switches->push_back(std::string(mark).append("!").append(name));
  }
}

}  // namespace

std::vector<std::string> SwitchesFor7z(const Request& request, const PackRun& run) {
  std::vector<std::string> switches = {
      request.command,
      request.zip ? "-tzip" : "-t7z",
      "-sae",  // the archive's name as it is, no extension added
      "-spd",  // names are no patterns
      "-sse",  // stop at a file that does not open
      "-bso1",
      "-bse2",
      "-bsp1",  // 7z flushes its standard output only with the progress on it
      "-y",
  };
  if (request.zip) {
    switches.emplace_back("-mcu=on");
  }
  if (!request.level.empty()) {
    switches.push_back(request.level);
  }
  switches.insert(switches.end(), run.memory.begin(), run.memory.end());
  if (!request.password.empty()) {
    switches.emplace_back("-p");  // asks on standard input
  }
  if (run.follow_links) {
    switches.emplace_back("-l");
  }
  // Of this job and of others, which may be anybody's.
  switches.push_back(std::string("-xrw!") + Device::kWorkFolderPattern);
  for (const std::string& name : request.exclude) {
    switches.push_back("-xr!" + name);
  }
  AddNames("-x", run.left_out, run.left_out_file, &switches);
  AddNames("-i", run.sources, run.sources_file, &switches);
  if (run.new_archive.empty()) {
    switches.push_back("-u" + request.actions);
  } else {
    switches.emplace_back("-u-");
    switches.push_back("-u" + request.actions + "!" + run.new_archive);
  }
  switches.push_back(run.archive);
  return switches;
}

bool IsExcluded(const Request& request, const std::string& path) {
  const std::string framed = "/" + path + "/";
  return std::any_of(request.exclude.begin(), request.exclude.end(), [&](const std::string& name) {
    return framed.find("/" + name + "/") != std::string::npos;
  });
}

}  // namespace Archiver
