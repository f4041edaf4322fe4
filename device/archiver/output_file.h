#pragma once

#include <string>

#include "device/archiver/unique_fd.h"

namespace Archiver {

// Whether `path` is an archive to update. Throws Failure when something other than a regular file
// bears the name, or when the name cannot be used.
bool ArchiveExists(const std::string& path);

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
  // Moves the result over the archive.
  void Publish() const;

 private:
  void Sweep() const;
  bool CreateLocked();

  std::string archive_;
  std::string parent_;
  std::string path_;
  UniqueFd lock_;
};

}  // namespace Archiver
