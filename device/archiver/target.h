#pragma once

#include <sys/types.h>

#include <ctime>
#include <string>

#include "device/base/file_descriptor.h"

namespace Archiver {

// The file that bears the archive's name, as it was when somebody looked.
struct ArchiveState {
  bool exists = false;
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  timespec changed{};  // its contents

  bool operator==(const ArchiveState& other) const;
};

// What stands under `path`, an archive to update or nothing. Throws Failure when something other
// than a regular file bears the name, or when the name cannot be used.
ArchiveState LookAtArchive(const std::string& path);

// A hidden folder beside the archive in which 7z and libzip write, with names as long as they like,
// until the result takes the archive's name in one step. It goes with everything in it; one that a
// killed run has left is swept by the next run in the same folder, which tells it by the lock.
class WorkFolder {
 public:
  explicit WorkFolder(std::string archive);
  ~WorkFolder();
  WorkFolder(const WorkFolder&) = delete;
  WorkFolder& operator=(const WorkFolder&) = delete;

  const std::string& Path() const { return path_; }
  std::string Result() const;
  // Moves the result over the archive, if that is still as it was seen: what another run has put
  // there meanwhile is not in the result and would be lost. Throws Failure.
  void Publish(const ArchiveState& seen) const;

 private:
  void Sweep() const;
  bool CreateLocked();

  std::string archive_;
  std::string parent_;
  std::string path_;
  Device::FileDescriptor lock_;
};

}  // namespace Archiver
