#include "device/host/user_path.h"

#include <fcntl.h>
#include <poll.h>

#include <algorithm>
#include <cerrno>
#include <iterator>

#include "device/base/json_text.h"
#include "device/base/open_below.h"
#include "device/model/device.h"
#include "device/platform/lumo/errors.h"
#include "platform/lumo/file_manager.h"

namespace Device {

Refused::Refused(int code)
    : std::runtime_error(ErrorText(code)),
      answer(code == KAVO::kErrNoPrivilege || code == KAVO::kErrOutsideShare ? kHttpForbidden
                                                                             : kHttpNotFound,
             JsonObject({{"code", code}, {"error", ErrorText(code)}})) {}

namespace {

[[noreturn]] void RefuseForErrno() {
  if (errno == ELOOP) {
    throw Refused(KAVO::kErrOutsideShare);
  }
  SetLastErrno(errno);
  throw Refused(LumoLibGetErr());
}

}  // namespace

ResolvedPath ResolveForUser(const std::string& user, const std::string& path) {
  ResolvedPath resolved = Resolve(user, path);
  if (resolved.error != 0) {
    throw Refused(resolved.error);
  }
  if (AccessOf(resolved, user) == Access::kNone) {
    throw Refused(KAVO::kErrNoPrivilege);
  }
  return resolved;
}

FileDescriptor OpenForUser(const std::string& user, const ResolvedPath& path, int flags) {
  FileDescriptor opened = OpenUserPath(TheDevice().FixedFolders(user), path.real_path, flags);
  if (!opened) {
    RefuseForErrno();
  }
  return opened;
}

FileDescriptor OpenFileOf(const std::string& user, const ResolvedPath& path, struct stat& status) {
  const FileDescriptor found = OpenForUser(user, path, O_PATH);
  if (fstat(found.Get(), &status) != 0 || !S_ISREG(status.st_mode)) {
    throw Refused(kHttpNotFound, "not a file");
  }
  FileDescriptor file(open(PathOf(found.Get()).c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  if (!file) {
    RefuseForErrno();
  }
  return file;
}

bool Patience::IsOver(int source) const {
  using std::chrono::milliseconds;
  const auto left = std::chrono::ceil<milliseconds>(end_ - std::chrono::steady_clock::now());
  pollfd sources[] = {{stream_, POLLIN, 0}, {source, POLLIN, 0}};
  poll(sources, std::size(sources),
       source < 0 ? 0 : static_cast<int>(std::max(left, milliseconds(0)).count()));
  return sources[0].revents != 0 || left.count() <= 0;
}

}  // namespace Device
