// Users of the device must be able to walk to its folder, wherever it was made.
#pragma once

#include <string>

namespace Device {

// When a folder above `root` is closed to others (a home of mode 0700), lets this process and those
// forked from it see that folder as one that holds the device alone and is open to walk through.
// The rest of the machine sees no change. Needs root. Throws std::runtime_error that names the
// folder.
void MakeReachable(const std::string& root);

}  // namespace Device
