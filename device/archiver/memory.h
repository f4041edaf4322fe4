// How much memory 7z takes, and how it is made to take less.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace Archiver {

// The switches with which a 7z archive of that level ("-mx6", or empty for 7z's own) takes so many
// bytes of memory at most; none when the level takes no more as it is, and for a level that does
// not compress. Fewer threads go before a smaller dictionary. Where the least is too much, the
// least.
std::vector<std::string> SwitchesWithin(std::uint64_t memory, const std::string& level,
                                        unsigned int processors);

}  // namespace Archiver
