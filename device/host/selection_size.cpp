#include <dirent.h>
#include <fcntl.h>

#include <memory>

#include "device/base/json_text.h"
#include "device/base/open_below.h"
#include "device/base/work_folder.h"
#include "device/host/user_files.h"
#include "device/model/device.h"

namespace Device {

namespace {

constexpr char kMetadata[] = "@eaDir";  // which the module leaves out

struct Count {
  const Patience& patience;
  Json::Int64 files = 0;
  Json::Int64 folders = 0;
  Json::Int64 bytes = 0;
  bool is_complete = true;

  void Add(int parent, const std::string& name) {
    struct stat status {};
    if (fstatat(parent, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
      is_complete = false;
    } else if (S_ISDIR(status.st_mode)) {
      ++folders;
      AddFolder(openat(parent, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    } else {
      ++files;
      bytes += S_ISREG(status.st_mode) ? status.st_size : 0;
    }
  }

  void AddFolder(int fd) {
    const std::unique_ptr<DIR, int (*)(DIR*)> folder(fd < 0 ? nullptr : fdopendir(fd), closedir);
    const dirent* entry = nullptr;
    while (folder && !patience.IsOver() && (entry = readdir(folder.get())) != nullptr) {
      const std::string name = entry->d_name;
      if (name != "." && name != ".." && name != kMetadata && !IsWorkFolderName(name)) {
        Add(fd, name);
      }
    }
    is_complete = is_complete && folder && entry == nullptr && !patience.IsOver();
  }
};

}  // namespace

Json::Value SizeOf(const std::string& user, const Json::Value& paths, const Patience& patience) {
  Count count{patience};
  for (const Json::Value& path : paths) {
    const std::string full = ResolveForUser(user, path.asString()).real_path;
    const std::size_t slash = full.rfind('/');
    count.Add(OpenUserPath(TheDevice().FixedFolders(user), full.substr(0, slash), O_PATH).Get(),
              full.substr(slash + 1));
  }
  return JsonObject({{"files", count.files},
                     {"folders", count.folders},
                     {"bytes", count.bytes},
                     {"complete", count.is_complete}});
}

}  // namespace Device
