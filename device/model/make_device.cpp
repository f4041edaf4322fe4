// Making a device: its folders, with the access that device.json gives.
#include <sys/acl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <memory>
#include <stdexcept>

#include "device/base/file_descriptor.h"
#include "device/model/device.h"

namespace Device {

namespace {

namespace fs = std::filesystem;

constexpr mode_t kFolderMode = 0755;
constexpr mode_t kPrivateMode = 0700;
constexpr mode_t kConfigMode = 0600;  // it holds password hashes

void MakeFolder(const std::string& path, mode_t mode) {
  if ((mkdir(path.c_str(), mode) != 0 && errno != EEXIST) || chmod(path.c_str(), mode) != 0) {
    ThrowErrno("folder '" + path + "'");
  }
}

void GiveTo(const std::string& path, const User& user) {
  if (geteuid() == 0 && chown(path.c_str(), user.uid, kUsersGroup) != 0) {
    ThrowErrno("owner of '" + path + "'");
  }
}

const char* Permissions(Access access, bool is_writable) {
  return access == Access::kNone                       ? "---"
         : access == Access::kListDenied               ? "--x"
         : access == Access::kReadWrite && is_writable ? "rwx"
                                                       : "r-x";
}

// The access list of a shared folder in the form of acl_from_text. Those who may not list the
// folder may still read what they know the name of, so what is made in it is readable for them.
std::string AclText(const Config& config, const Share& share, acl_type_t type) {
  std::string text = "u::rwx,g::---,o::---,m::rwx";
  for (const auto& [user, access] : share.access) {
    const Access shown =
        type == ACL_TYPE_DEFAULT && access == Access::kListDenied ? Access::kReadOnly : access;
    text.append(",u:").append(std::to_string(config.FindUser(user)->uid)).append(":");
    text.append(Permissions(shown, !share.read_only));
  }
  return text;
}

void SetAcl(const std::string& path, const std::string& text, acl_type_t type) {
  const std::unique_ptr<void, int (*)(void*)> acl(acl_from_text(text.c_str()), acl_free);
  if (acl == nullptr || acl_set_file(path.c_str(), type, static_cast<acl_t>(acl.get())) != 0) {
    ThrowErrno("access list of '" + path + "'");
  }
}

void MakeShare(const std::string& root, const Config& config, const Share& share) {
  const std::string path = root + "/" + share.volume + "/" + share.name;
  MakeFolder(path, kFolderMode);
  if (geteuid() == 0) {  // else every user is the caller, who owns the folder
    for (const acl_type_t type : {ACL_TYPE_ACCESS, ACL_TYPE_DEFAULT}) {
      SetAcl(path, AclText(config, share, type), type);
    }
  }
}

void MakeUser(const std::string& root, const User& user) {
  const std::string homes = root + "/" + user.home + "/homes";
  MakeFolder(homes, kFolderMode);
  for (const std::string& path :
       {homes + "/" + user.name, root + "/" + kUsersFolder + "/" + user.name}) {
    MakeFolder(path, kPrivateMode);
    GiveTo(path, user);
  }
}

void MakeFolders(const std::string& root, const Config& config, const std::string& config_text) {
  if (fs::exists(root) && !fs::is_empty(root)) {
    throw std::runtime_error("the folder is not empty");
  }
  fs::create_directories(root);
  MakeFolder(root, kFolderMode);
  MakeFolder(root + "/" + kUsersFolder, kFolderMode);
  for (const std::string& volume : config.volumes) {
    MakeFolder(root + "/" + volume, kFolderMode);
  }
  for (const User& user : config.users) {
    MakeUser(root, user);
  }
  for (const Share& share : config.shares) {
    MakeShare(root, config, share);
  }
  std::ofstream file(root + "/" + kConfigFile);
  if (!(file << config_text << std::flush) ||
      chmod((root + "/" + kConfigFile).c_str(), kConfigMode) != 0) {
    ThrowErrno(kConfigFile);
  }
}

}  // namespace

void Make(const std::string& folder, const std::string& config_text) {
  try {
    MakeFolders(fs::absolute(folder).lexically_normal().string(), ParseConfig(config_text),
                config_text);
  } catch (const std::exception& error) {
    throw std::runtime_error("cannot make device '" + folder + "': " + error.what());
  }
}

}  // namespace Device
