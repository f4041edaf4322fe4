#include "device/base/fence.h"

#include <fcntl.h>
#include <linux/landlock.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <iterator>

namespace Device {

namespace {

// Newer than the distribution's header: by the version of Landlock that knows them first.
constexpr std::uint64_t kTruncate = 1ULL << 14U;         // 3
constexpr std::uint64_t kBindAndConnectTcp = 3;          // 4
constexpr std::uint64_t kAbstractSocketsAndSignals = 3;  // 6
constexpr int kVersionOfNetwork = 4;
constexpr int kVersionOfScopes = 6;

struct Handled {
  std::uint64_t files;
  std::uint64_t network;  // from kVersionOfNetwork on
  std::uint64_t scopes;   // from kVersionOfScopes on
};

constexpr std::uint64_t kRead = LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_READ_DIR;
constexpr std::uint64_t kWrite = LANDLOCK_ACCESS_FS_WRITE_FILE | LANDLOCK_ACCESS_FS_MAKE_REG |
                                 LANDLOCK_ACCESS_FS_REMOVE_FILE | kTruncate;
constexpr std::uint64_t kFileRights =
    LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_EXECUTE | LANDLOCK_ACCESS_FS_WRITE_FILE;

constexpr const char* kSystemPrograms[] = {"/usr/bin", "/usr/lib", "/usr/lib64", "/lib", "/lib64"};
constexpr const char* kSystemTables[] = {
#ifdef __SANITIZE_ADDRESS__
    "/proc",  // where the sanitizer reads about its own process
#endif
    "/dev/urandom",  // for keys
    "/etc/ld.so.cache",
    "/etc/localtime",
    "/usr/share/zoneinfo",
    "/usr/share/locale",
    "/sys/devices/system/cpu"};

// 0 where there is none.
int Version() {
  static const long version =
      syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION);
  return version < 0 ? 0 : static_cast<int>(version);
}

// All rights that the version knows: of the first version 13, and so on.
std::uint64_t HandledFiles() {
  constexpr unsigned int kRights[] = {0, 13, 14, 15, 15, 16};
  return (1ULL << kRights[std::min<std::size_t>(Version(), std::size(kRights) - 1)]) - 1;
}

}  // namespace

Fence::Fence() {
  if (!IsSupported()) {
    return;
  }
  const Handled handled = {HandledFiles(), kBindAndConnectTcp, kAbstractSocketsAndSignals};
  const std::size_t size = Version() >= kVersionOfScopes    ? sizeof handled
                           : Version() >= kVersionOfNetwork ? offsetof(Handled, scopes)
                                                            : offsetof(Handled, network);
  rules_ =
      FileDescriptor(static_cast<int>(syscall(SYS_landlock_create_ruleset, &handled, size, 0)));
  if (!rules_) {
    ThrowErrno("fence");
  }
  for (const char* path : kSystemPrograms) {
    AllowRunning(FileDescriptor(open(path, O_PATH | O_CLOEXEC)).Get());
  }
  Allow(FileDescriptor(open("/dev/null", O_PATH | O_CLOEXEC)).Get(),
        LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_WRITE_FILE);
  for (const char* path : kSystemTables) {
    AllowReading(FileDescriptor(open(path, O_PATH | O_CLOEXEC)).Get());
  }
}

bool Fence::IsSupported() { return Version() > 0; }

void Fence::AllowReading(int fd) { Allow(fd, kRead); }

void Fence::AllowListing(int fd) { Allow(fd, LANDLOCK_ACCESS_FS_READ_DIR); }

void Fence::AllowWriting(int fd) { Allow(fd, kRead | kWrite); }

void Fence::AllowRunning(int fd) { Allow(fd, kRead | LANDLOCK_ACCESS_FS_EXECUTE); }

void Fence::Allow(int fd, unsigned long long rights) {
  struct stat status {};
  if (!rules_ || fd < 0 || fstat(fd, &status) != 0) {
    return;  // what is not there needs no right
  }
  const std::uint64_t possible = S_ISDIR(status.st_mode) ? HandledFiles() : kFileRights;
  const landlock_path_beneath_attr rule = {rights & possible, fd};
  if (syscall(SYS_landlock_add_rule, rules_.Get(), LANDLOCK_RULE_PATH_BENEATH, &rule, 0) != 0) {
    ThrowErrno("fence");
  }
}

bool Fence::Enter() const {
  return prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
         (!rules_ || syscall(SYS_landlock_restrict_self, rules_.Get(), 0) == 0);
}

}  // namespace Device
