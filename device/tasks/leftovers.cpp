#include "device/tasks/leftovers.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "device/base/open_below.h"
#include "device/base/work_folder.h"
#include "device/model/device.h"
#include "device/tasks/task_store.h"
#include "device/tasks/workers.h"

namespace Device {

namespace {

// The module makes it under a name of its own, which nobody else has a reason to use.
void RemoveList(const std::string& path) {
  constexpr char kListPrefix[] = "/tmp/lumozip";
  struct stat status {};
  if (path.rfind(kListPrefix, 0) == 0 && lstat(path.c_str(), &status) == 0 &&
      S_ISREG(status.st_mode) && status.st_uid == geteuid()) {
    unlink(path.c_str());
  }
}

}  // namespace

void RemoveLeftovers(const std::string& user) {
  TaskStore& store = StoreOf(user);
  for (const LeftoversRow& left : store.AllLeftovers()) {
    if (IsWorkerAlive(user, left.worker)) {
      continue;
    }
    RemoveList(left.list);
    const FileDescriptor folder =
        OpenUserPath(TheDevice().FixedFolders(user), left.folder, O_RDONLY | O_DIRECTORY);
    if (!folder || RemoveStaleWorkFolder(folder, left.work_folder)) {
      store.RemoveLeftovers(left.number);
    }
  }
}

}  // namespace Device
