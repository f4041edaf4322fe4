// The hidden folder, beside its target, in which the archiver makes an archive.
//
// Its name is of a fixed form, so that whoever packs or lists its surroundings can leave it out. It
// holds a file that marks it as a job's, locked for as long as the job runs, and what 7z writes.
#pragma once

#include <string>

#include "device/base/file_descriptor.h"

namespace Device {

// In it: the archive that is made, whatever 7z puts behind its name, and a folder of files that
// stand in for others.
inline constexpr char kWorkResult[] = "new";
inline constexpr char kWorkMirror[] = "mirror";

// What its name looks like, as 7z's wildcards have it.
inline constexpr char kWorkFolderPattern[] = ".kavo-7z-????????????????????????????????";

// A name that no other has. Throws std::exception when the system has no random numbers.
std::string NewWorkFolderName();
bool IsWorkFolderName(const std::string& name);

// Owns a work folder, and holds it by descriptor, whatever is renamed: at the end it is removed.
class WorkFolder {
 public:
  // Makes it in the open folder `parent`. Throws std::system_error.
  WorkFolder(const FileDescriptor& parent, const std::string& name);
  ~WorkFolder();

  int Get() const { return folder_.Get(); }

 private:
  FileDescriptor folder_;
  FileDescriptor mark_;
};

// Removes a work folder whose job is gone. Leaves alone what is not the caller's or is in use,
// what bears no mark unless it is empty, and what no job has put there. False when one of a job's
// stays, to be tried again.
bool RemoveStaleWorkFolder(const FileDescriptor& parent, const std::string& name);

}  // namespace Device
