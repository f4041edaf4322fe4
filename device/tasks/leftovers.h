// What workers and archivers leave behind when they are killed. They note it in the store before,
// so that the user's next worker or the next start of `serve` can remove it.
#pragma once

#include <string>

namespace Device {

// Removes what is left of the user's workers that are gone. To be called with the user's identity.
// Throws std::runtime_error.
void RemoveLeftovers(const std::string& user);

}  // namespace Device
