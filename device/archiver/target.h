#pragma once

#include <sys/stat.h>

#include <string>
#include <vector>

#include "device/base/file_descriptor.h"

namespace Archiver {

// The file that is to be the archive: its folder, held by descriptor, and its name there.
class Target {
 public:
  // `path` is absolute; below the fixed folders (see OpenUserPath) no link is followed. Throws
  // Failure when the folder cannot be opened, when something other than a regular file bears the
  // name, or when the name cannot be used.
  Target(std::string path, const std::vector<std::string>& fixed);

  const std::string& Path() const { return path_; }
  const std::string& Name() const { return name_; }
  const Device::FileDescriptor& Folder() const { return folder_; }
  // The archive that stands there, opened as a path (O_PATH); invalid when there is none.
  const Device::FileDescriptor& Old() const { return old_; }

  // Moves the result out of the work folder over the old archive, if that is still as it was: what
  // another run has put there meanwhile is not in the result and would be lost. Returns the result,
  // opened as a path. Throws Failure.
  Device::FileDescriptor Publish(int work_folder) const;

 private:
  Device::FileDescriptor OpenFolder() const;
  bool IsAsSeen(int folder, const std::string& name) const;

  const std::string path_;
  const std::string name_;
  const std::vector<std::string>& fixed_;
  Device::FileDescriptor folder_;
  Device::FileDescriptor old_;
  struct stat seen_ {};  // of the old archive
};

}  // namespace Archiver
