// What the archiver tells kavo-link-free.so, see there.
#pragma once

namespace Archiver {

// The variable that is set where 7z runs in a staging folder.
inline constexpr char kStagedVariable[] = "KAVO_STAGED";

}  // namespace Archiver
