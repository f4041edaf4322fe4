#include "device/archiver/switches.h"

#include <algorithm>
#include <cstdlib>

#include "device/base/work_folder.h"

namespace Archiver {
namespace {

constexpr int kOwnLevel = 5;
constexpr unsigned int kLeastDictionaryBits = 16;

// How 7z compresses at a level: so many blocks at once, each with a dictionary of its own.
struct Plan {
  int level;
  unsigned int blocks;
  unsigned int dictionary_bits;

  bool IsFast() const { return level < kOwnLevel; }
  unsigned int ThreadsOfBlock() const { return IsFast() ? 1 : 2; }

  // As measured with 7z 26.02, rounded up.
  std::uint64_t Memory() const {
    constexpr std::uint64_t kProgram = std::uint64_t{16} << 20U;
    // So many bytes for each byte of the dictionary.
    constexpr std::uint64_t kFast = 10;
    constexpr std::uint64_t kSingle = 12;  // at a thorough level, of one block
    constexpr std::uint64_t kBeside = 20;  // of several, whose input and output are held beside
    const std::uint64_t times = IsFast() ? kFast : blocks == 1 ? kSingle : kBeside;
    return kProgram + times * blocks * (std::uint64_t{1} << dictionary_bits);
  }
};

// What 7z chooses by itself.
Plan PlanFor(const std::string& level_switch, unsigned int processors) {
  constexpr std::size_t kMarkLength = 3;  // "-mx"
  const int level =
      level_switch.empty() ? kOwnLevel : std::atoi(level_switch.c_str() + kMarkLength);
  constexpr int kMostBits = 28;
  const int bits = level < kOwnLevel ? 2 * level + 16 : std::min(level + 20, kMostBits);
  Plan plan{level, 1, static_cast<unsigned int>(bits)};
  plan.blocks = std::max(1U, processors / plan.ThreadsOfBlock());
  return plan;
}

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

std::vector<std::string> SwitchesWithin(std::uint64_t memory, const std::string& level,
                                        unsigned int processors) {
  const Plan own = PlanFor(level, processors);
  Plan plan = own;
  while (own.level > 0 && plan.Memory() > memory && plan.blocks > 1) {
    --plan.blocks;
  }
  while (own.level > 0 && plan.Memory() > memory && plan.dictionary_bits > kLeastDictionaryBits) {
    --plan.dictionary_bits;
  }
  std::vector<std::string> switches;
  if (plan.blocks != own.blocks) {
    switches.push_back("-mmt=" + std::to_string(plan.blocks * plan.ThreadsOfBlock()));
  }
  if (plan.dictionary_bits != own.dictionary_bits) {
    switches.push_back("-md=" + std::to_string(1U << plan.dictionary_bits) + "b");
  }
  return switches;
}

bool IsExcluded(const Request& request, const std::string& path) {
  const std::string framed = "/" + path + "/";
  return std::any_of(request.exclude.begin(), request.exclude.end(), [&](const std::string& name) {
    return framed.find("/" + name + "/") != std::string::npos;
  });
}

}  // namespace Archiver
