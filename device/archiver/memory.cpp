#include "device/archiver/memory.h"

#include <algorithm>
#include <cstdlib>

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

}  // namespace

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

}  // namespace Archiver
