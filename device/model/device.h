// The device that this process and those forked from it belong to: its folder and its
// configuration.
//
// In the folder: device.json; a folder for each volume; in a volume its shared folders and, under
// "homes", the users' homes; under "users" a folder for each user, that only that user can enter,
// with the store of tasks; serve.lock and jobs.lock, empty files for the locks of who serves the
// device and of its jobs.
#pragma once

#include <string>
#include <vector>

#include "device/base/file_descriptor.h"
#include "device/model/config.h"

namespace Device {

// Groups of the device's users. High numbers, so that they are nobody's on a workstation.
inline constexpr gid_t kUsersGroup = 65100;
inline constexpr gid_t kAdminsGroup = 65101;

// What lies in the device's folder beside the volumes.
inline constexpr char kConfigFile[] = "device.json";
inline constexpr char kUsersFolder[] = "users";
inline constexpr char kLockFile[] = "serve.lock";
inline constexpr char kQueueFile[] = "jobs.lock";
inline constexpr char kHomeShare[] = "home";

struct OpenDevice {
  std::string root;  // absolute, links resolved
  Config config;
  std::vector<std::string> real_volumes;  // their folders, links resolved
  bool switches_identity = false;         // false: not root, all users are the caller
  FileDescriptor archiver;                // the program that runs in place of /usr/bin/7z
  FileDescriptor zip_program;             // which the archiver asks about zips
  FileDescriptor link_free;               // the library that keeps 7z from following links
  FileDescriptor module;                  // the shared library that serves the requests
  FileDescriptor queue;                   // that jobs are queued by locks on

  std::string VolumePath(const std::string& volume) const { return root + "/" + volume; }
  std::string SharePath(const Share& share) const {
    return VolumePath(share.volume) + "/" + share.name;
  }
  std::string HomePath(const User& user) const {
    return VolumePath(user.home) + "/homes/" + user.name;
  }
  // Paths of folders that no user can rename or replace: volumes, shared folders, the user's home.
  std::vector<std::string> FixedFolders(const std::string& user) const;
  std::string StateFolder(const std::string& user) const {
    return root + "/" + kUsersFolder + "/" + user;
  }
};

// Opens the device in a folder, once in a process, before anything below platform/ is called.
// Throws std::runtime_error that names the device and the reason.
OpenDevice& Open(const std::string& folder);
// The device that is open.
OpenDevice& TheDevice();

// Bytes that this process and its children may have: what is installed or, if that is less, the
// limit of a control group that it is in, or of its address space.
std::uint64_t InstalledMemory();

// Makes a device in a folder that is not there yet, or empty, from the text of a device.json.
// Throws std::runtime_error.
void Make(const std::string& folder, const std::string& config_text);

}  // namespace Device
