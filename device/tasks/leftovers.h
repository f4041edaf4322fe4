// What workers and archivers leave behind when they are killed. They note it in the store before,
// so that the user's next worker or the next start of `serve` can remove it. A worker that is
// killed while it writes its list has noted nothing yet: that list goes when it is old.
#pragma once

#include <string>

namespace Device {

// Removes what is left of the user's workers that are gone. To be called with the user's identity.
// Throws std::runtime_error.
void RemoveLeftovers(const std::string& user);
// Removes the list files of the user whose identity the process has that are so old that no
// archiver can be about to read them, whichever device they are of.
void RemoveOldLists();

}  // namespace Device
