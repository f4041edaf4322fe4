// What a program may reach, held by the kernel (Landlock), whatever it is made to try.
#pragma once

#include "device/base/file_descriptor.h"

namespace Device {

// The program can open nothing that was not allowed here, connect to nothing over TCP and gain no
// rights. What it may do without opening, the kernel leaves to it: look at files' status, change
// mode and times of the user's own ones, connect to a socket by its path.
// Paths do not matter: what is allowed is the very file or folder that the descriptor holds, and
// what lies below it at the moment of opening. Where the kernel cannot, it allows everything.
class Fence {
 public:
  // With the system's own programs, libraries and tables allowed. Throws std::system_error.
  Fence();

  // False where the kernel has no Landlock.
  static bool IsSupported();

  // A file, or a folder and all below it. Throws std::system_error.
  void AllowReading(int fd);
  // Names in a folder and all folders below it. Throws std::system_error.
  void AllowListing(int fd);
  // A folder and the files in it. Throws std::system_error.
  void AllowWriting(int fd);
  // A program, or a folder of programs and libraries. Throws std::system_error.
  void AllowRunning(int fd);

  // Confines the calling process, for good. False, with errno, when it cannot. Safe after vfork.
  bool Enter() const;

 private:
  void Allow(int fd, unsigned long long rights);

  FileDescriptor rules_;
};

}  // namespace Device
