// What workers and archivers leave behind when they are killed, so that the user's next worker or
// the next start of `serve` can remove it. To be used with the user's identity.
#pragma once

#include <string>

namespace Device {

struct Leftovers {
  std::string list;         // path of the list file
  std::string folder;       // path of the folder in which the archive is made
  std::string work_folder;  // name of the hidden folder there
};

// Notes what the calling process, a worker of the user's, is going to leave if it is killed. Throws
// std::runtime_error.
void NoteLeftovers(const std::string& user, const Leftovers& leftovers);

// Removes what is left of the user's workers that are gone. Throws std::runtime_error.
void RemoveLeftovers(const std::string& user);

}  // namespace Device
