#include "device/tasks/leftovers.h"

#include <fcntl.h>
#include <glob.h>
#include <sys/stat.h>
#include <unistd.h>

#include <ctime>
#include <limits>
#include <string>
#include <vector>

#include "device/base/open_below.h"
#include "device/base/work_folder.h"
#include "device/model/device.h"
#include "device/tasks/task_store.h"
#include "device/tasks/workers.h"

namespace Device {

namespace {

constexpr std::time_t kAnyAge = std::numeric_limits<std::time_t>::max();
constexpr std::time_t kOldList = 600;  // seconds

// What mkstemp and mkdtemp make of the module's template, in folders where nobody else can put
// another thing in its place.
bool IsOwn(const std::string& path, mode_t kind_and_mode, std::time_t newest) {
  struct stat status {};
  return path.rfind("/tmp/lumozip", 0) == 0 && lstat(path.c_str(), &status) == 0 &&
         status.st_mode == kind_and_mode && status.st_uid == geteuid() && status.st_mtime <= newest;
}

void RemoveList(const std::string& path, std::time_t newest) {
  if (IsOwn(path, S_IFREG | S_IRUSR | S_IWUSR, newest)) {
    unlink(path.c_str());
  }
}

std::vector<std::string> Find(const std::string& pattern) {
  glob_t found{};
  const bool is_found = glob(pattern.c_str(), GLOB_NOSORT, nullptr, &found) == 0;
  std::vector<std::string> paths;
  if (is_found) {
    paths.assign(found.gl_pathv, found.gl_pathv + found.gl_pathc);
  }
  globfree(&found);
  return paths;
}

}  // namespace

void RemoveLeftovers(const std::string& user) {
  TaskStore& store = StoreOf(user);
  for (const LeftoversRow& left : store.AllLeftovers()) {
    if (IsWorkerAlive(user, left.worker)) {
      continue;
    }
    RemoveList(left.list, kAnyAge);
    const FileDescriptor folder =
        OpenUserPath(TheDevice().FixedFolders(user), left.folder, O_RDONLY | O_DIRECTORY);
    if (!folder || RemoveStaleWorkFolder(folder, left.work_folder)) {
      store.RemoveLeftovers(left.number);
    }
  }
}

void RemoveOldLists() {
  const std::string name = "/lumozip??????";
  const std::time_t newest = std::time(nullptr) - kOldList;
  for (const std::string& path : Find("/tmp" + name)) {
    RemoveList(path, newest);
    if (IsOwn(path, S_IFDIR | S_IRWXU, kAnyAge)) {  // of links to several shared folders
      for (const std::string& inner : Find(path + name)) {
        RemoveList(inner, newest);
      }
    }
  }
}

}  // namespace Device
