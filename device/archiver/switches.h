#pragma once

#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "device/archiver/command_line.h"
#include "device/archiver/list_file.h"

namespace Archiver {

// One run of the stock 7z.
struct PackRun {
  std::string archive;       // what 7z opens or creates
  std::string new_archive;   // where the result goes when `archive` must stay as it is
  NamesFor7z sources;        // relative to the run's folder
  NamesFor7z left_out;       // likewise; each stands for one file or folder
  std::string sources_file;  // path under which 7z finds the text of sources.list
  std::string left_out_file;
  std::vector<std::string> memory;  // SwitchesWithin
  bool follow_links = false;
  std::set<std::string> left_out_links;  // among left_out; 7z warns of those that lead nowhere
};

// The argument vector of `run`, without the program's name.
std::vector<std::string> SwitchesFor7z(const Request& request, const PackRun& run);

// The switches with which a 7z archive of that level ("-mx6", or empty for 7z's own) takes so many
// bytes of memory at most; none when the level takes no more as it is, and for a level that does
// not compress. Fewer threads go before a smaller dictionary. Where the least is too much, the
// least.
std::vector<std::string> SwitchesWithin(std::uint64_t memory, const std::string& level,
                                        unsigned int processors);

// Whether the request leaves out `path`: some part of it bears an excluded name.
bool IsExcluded(const Request& request, const std::string& path);

}  // namespace Archiver
