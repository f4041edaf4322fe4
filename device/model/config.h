// What device.json says: the users, volumes and shared folders of a device.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace Device {

struct User {
  std::string name;
  uid_t uid = 0;
  bool admin = false;
  std::string codepage;  // of the personal settings; may be empty
  std::string password;  // as crypt(3) has it; empty: the user cannot sign in
  std::string home;      // the volume that holds the home folder
};

enum class Access { kNone, kListDenied, kReadOnly, kReadWrite };

struct Share {
  std::string name;
  std::string volume;
  bool encrypted = false;
  bool read_only = false;
  std::map<std::string, Access> access;  // by user name; absent: none
};

struct Config {
  std::vector<User> users;
  std::vector<std::string> volumes;
  std::vector<Share> shares;
  unsigned int jobs_at_once = 2;      // of one user
  std::uint64_t memory_for_jobs = 0;  // bytes, of all that run; 0: half of what is installed

  // Null when there is none of that name.
  const User* FindUser(const std::string& name) const;
  const Share* FindShare(const std::string& name) const;
};

// Reads a device.json, whole and valid or not at all. Throws std::runtime_error that names the line
// and the reason.
Config ParseConfig(const std::string& text);

}  // namespace Device
