#include "device/platform/lumo/paths.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>

#include "device/base/for_each_part.h"
#include "device/base/open_below.h"
#include "device/platform/lumo/errors.h"
#include "device/platform/lumo/identity.h"
#include "device/platform/operations.h"

namespace Device {

namespace {

constexpr std::size_t kNameMax = 255;  // bytes
constexpr std::size_t kEncryptedNameMax = 143;

// The path's parts. False when ".." leads above the first of them, the shared folder.
bool SplitUserPath(std::string_view path, std::vector<std::string_view>& parts) {
  bool is_inside = true;
  ForEachPart(path, "/", [&](std::string_view part) {
    if (part == "..") {
      is_inside = is_inside && parts.size() > 1;
      parts.resize(parts.size() - (is_inside ? 1 : 0));
    } else if (!part.empty() && part != ".") {
      parts.push_back(part);
    }
  });
  return is_inside;
}

// Fills in the shared folder's fields. False when there is none of that name, or no such user.
bool FindShareFolder(const std::string& user, ResolvedPath& resolved) {
  const OpenDevice& device = TheDevice();
  if (resolved.share_name == kHomeShare) {
    const User* const owner = device.config.FindUser(user);
    if (owner == nullptr) {
      return false;
    }
    resolved.volume_path = device.VolumePath(owner->home);
    resolved.share_real_path = device.HomePath(*owner);
    return true;
  }
  resolved.share = device.config.FindShare(resolved.share_name);
  if (resolved.share == nullptr) {
    return false;
  }
  resolved.volume_path = device.VolumePath(resolved.share->volume);
  resolved.share_real_path = device.SharePath(*resolved.share);
  return true;
}

bool IsInsideOne(const std::string& path, const std::vector<std::string>& folders) {
  return std::any_of(folders.begin(), folders.end(),
                     [&](const std::string& folder) { return IsWithin(path, folder); });
}

// True of a link that leads off the volumes.
bool LeadsAway(const FileDescriptor& entry, const std::string& path) {
  struct stat status {};
  if (fstat(entry.Get(), &status) != 0 || !S_ISLNK(status.st_mode)) {
    return false;
  }
  std::error_code error;
  const std::string end = std::filesystem::canonical(path, error);
  return !error && !IsInsideOne(end, TheDevice().real_volumes);
}

// Refuses what lies outside the device or behind a link, whoever made it: user paths name folders.
// The last name may be a link's, which is packed as such.
int CheckPath(const std::string& path) {
  const std::vector<std::string> fixed = TheDevice().FixedFolders(CurrentUser());
  const FileDescriptor entry = OpenUserPath(fixed, path, O_PATH);
  const int error = entry ? 0 : errno;
  if (error == ELOOP || !IsInsideOne(path, fixed) || (entry && LeadsAway(entry, path))) {
    return SetLastError(KAVO::kErrOutsideShare);
  }
  if (error != 0 && error != ENOENT) {
    return SetLastErrno(error);
  }
  return 0;
}

int CheckFileName(const std::string& directory, const std::string& name) {
  if (name.empty() || name == "." || name == ".." || name.find('/') != std::string::npos) {
    return SetLastError(KAVO::kErrBadName);
  }
  const std::vector<Share>& shares = TheDevice().config.shares;
  const bool is_encrypted = std::any_of(shares.begin(), shares.end(), [&](const Share& share) {
    return share.encrypted && IsWithin(directory, TheDevice().SharePath(share));
  });
  if (name.size() > (is_encrypted ? kEncryptedNameMax : kNameMax)) {
    return SetLastError(is_encrypted ? KAVO::kErrNameTooLongEncrypted : KAVO::kErrNameTooLong);
  }
  return 0;
}

// The common leading part of two folders that end in "/".
std::string CommonFolder(const std::string& one, const std::string& other) {
  const auto end = std::mismatch(one.begin(), one.end(), other.begin(), other.end()).first;
  const std::string common(one.begin(), end);
  return common.substr(0, common.rfind('/') + 1);
}

std::string sources_folder;

}  // namespace

const std::string& SourcesFolder() { return sources_folder; }

ResolvedPath Resolve(const std::string& user, const std::string& path) {
  ResolvedPath resolved;
  std::vector<std::string_view> parts;
  if (path.empty() || path[0] != '/' || path.find('\0') != std::string::npos) {
    resolved.error = KAVO::kErrBadName;
  } else if (path.size() >= PATH_MAX) {
    resolved.error = KAVO::kErrNameTooLong;
  } else if (!SplitUserPath(path, parts)) {
    resolved.error = KAVO::kErrOutsideShare;
  } else if (parts.empty()) {
    resolved.error = KAVO::kErrNotFound;
  } else {
    resolved.share_name = parts.front();
    resolved.error = FindShareFolder(user, resolved) ? 0 : KAVO::kErrNotFound;
    resolved.share_path = "/" + resolved.share_name;
    resolved.real_path = resolved.share_real_path;
    resolved.share_path.reserve(path.size());
    resolved.real_path.reserve(resolved.real_path.size() + path.size());
    for (std::size_t part = 1; part < parts.size(); ++part) {
      resolved.share_path.append("/").append(parts[part]);
      resolved.real_path.append("/").append(parts[part]);
    }
    if (resolved.error == 0 && resolved.real_path.size() >= PATH_MAX) {
      resolved.error = KAVO::kErrNameTooLong;
    }
    resolved.aux_1 = resolved.share_path.substr(1 + resolved.share_name.size());
    resolved.aux_6 = user;
  }
  return resolved;
}

Access AccessOf(const ResolvedPath& path, const std::string& user) {
  if (path.share == nullptr) {
    return Access::kReadWrite;  // the user's own home
  }
  const auto found = path.share->access.find(user);
  return found == path.share->access.end() ? Access::kNone : found->second;
}

}  // namespace Device

using Device::Operation;

int PathInfoFactory::create(const char* user, const std::string& path, PathInfo& out) {
  Operation operation("PathInfoFactory::create", user, path);
  operation.Output("share_path", out.share_path)
      .Output("real_path", out.real_path)
      .Output("share_name", out.share_name)
      .Output("volume_path", out.volume_path)
      .Output("share_real_path", out.share_real_path);
  return operation.Run([&] {
    Device::ResolvedPath resolved = Device::Resolve(user, path);
    if (resolved.error == 0 && Device::AccessOf(resolved, user) == Device::Access::kNone) {
      resolved.error = KAVO::kErrNoPrivilege;  // the user does not even see the shared folder
    }
    if (resolved.error != 0) {
      Device::SetLastError(resolved.error);
      return 0;
    }
    out = std::move(resolved);
    return 1;
  });
}

int LumoFullPathGet(const char* path, std::string* full_path, std::string* home_test_path,
                    std::string* aux_1, std::string* aux_2, const std::string* user,
                    const char* charset) {
  return Operation("LumoFullPathGet", path, *user, charset)
      .Output("full_path", *full_path)
      .Output("home_test_path", *home_test_path)
      .Run([&] {
        const Device::ResolvedPath resolved = Device::Resolve(*user, path);
        if (resolved.error != 0) {
          Device::SetLastError(resolved.error);
          return 0;
        }
        *full_path = resolved.real_path;
        *home_test_path = resolved.real_path;
        *aux_1 = resolved.share_name;
        *aux_2 = resolved.volume_path;
        return 1;
      });
}

int IsDirUserHome(const std::string& path, const char* reserved) {
  return Operation("IsDirUserHome", path, reserved).Run([&] {
    const Device::OpenDevice& device = Device::TheDevice();
    const Device::User* const user = device.config.FindUser(Device::CurrentUser());
    return user != nullptr && Device::IsWithin(path, device.HomePath(*user)) ? 1 : 0;
  });
}

int LumoCheckPath(const char* path, bool option_1, int flags, std::string* out, bool option_2,
                  bool option_3, const char* reserved) {
  return Operation("LumoCheckPath", path, option_1, flags, out, option_2, option_3, reserved)
      .Run([&] { return Device::CheckPath(path); });
}

int LumoCheckFileName(const char* directory, const char* name) {
  return Operation("LumoCheckFileName", directory, name).Run([&] {
    return Device::CheckFileName(directory, name);
  });
}

std::string FindCommonParent(std::vector<std::string> directories) {
  return Operation("FindCommonParent", directories).Run([&] {
    std::string parent = directories.empty() ? "/" : directories.front();
    for (const std::string& directory : directories) {
      parent = Device::CommonFolder(parent, directory);
    }
    Device::sources_folder = parent.substr(0, parent.size() - 1);
    return parent;
  });
}

int VolumePathParse(const char* volume_path, VolumeInfo* out) {
  return Operation("VolumePathParse", volume_path).Run([&] {
    const Device::OpenDevice& device = Device::TheDevice();
    std::uint32_t index = 0;
    for (const std::string& volume : device.config.volumes) {
      if (device.VolumePath(volume) == volume_path) {
        *out = {{index, 0}};
        return 0;
      }
      ++index;
    }
    return Device::SetLastError(KAVO::kErrNotFound);
  });
}
