// Worker step: runs the external archiver on the staged list, follows its output into the task's
// progress and into error items, and fixes the new archive's mode, owner and index entry.
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/archiver_output.h"
#include "compress/task_record.h"
#include "platform/kavo/error_codes.h"
#include "platform/klib/system.h"
#include "platform/lumo/file_manager.h"

namespace Zantro {

namespace {

constexpr char kArchiverProgram[] = "/usr/bin/7z";
constexpr std::size_t kArgumentsMax = 32;
constexpr std::size_t kArchivePathSize = 4095;  // bytes; a longer path is cut to fit
constexpr std::uint32_t kArchiveMode = 0666;
constexpr std::uint32_t kNoSavedMask = static_cast<std::uint32_t>(-1);
constexpr int kIndexSingleFile = 1;
constexpr int kByPath = -1;  // instead of by descriptor

// The archiver's arguments, null-terminated, each a copy of its own.
class ArgumentVector {
 public:
  ArgumentVector() = default;
  ~ArgumentVector() {
    for (char* argument : arguments_) {
      std::free(argument);
    }
  }
  ArgumentVector(const ArgumentVector&) = delete;
  ArgumentVector& operator=(const ArgumentVector&) = delete;

  void Add(const std::string& argument) {
    char* const copy = strdup(argument.c_str());
    if (copy == nullptr) {
      throw std::bad_alloc();
    }
    arguments_.at(count_++) = copy;
  }
  char* const* Get() const { return arguments_.data(); }

 private:
  std::array<char*, kArgumentsMax> arguments_{};
  std::size_t count_ = 0;
};

void AddArguments(const _tag_CompressInfo_& info, const char* archive_path,
                  ArgumentVector& arguments) {
  arguments.Add(kArchiverProgram);
  arguments.Add(info.command);  // this one and the two switches also when empty
  arguments.Add("-utf16");
  arguments.Add(archive_path);
  arguments.Add(info.update_switch);
  arguments.Add(info.level_switch);
  if (!info.is7z) {
    arguments.Add("-lang" + info.codepage);
  }
  if (!info.password.empty()) {
    arguments.Add("-p" + info.password);
  }
  arguments.Add("-xr!@eaDir");  // the device's metadata directories
  arguments.Add("@" + info.list_file);
  arguments.Add("-progress");
}

struct StreamCloser {
  // The exit status is not looked at: failures stand in the output.
  void operator()(FILE* stream) const { KLIBCPclose(stream); }
};

int NameTooLongCode(const std::string& dest_path) {
  bool is_encrypted = false;
  if (LumoLibCheckEncryptShare(dest_path, &is_encrypted) == 0) {
    syslog(LOG_ERR, "%s:%d Failed to get share info for %s", kLogSource, __LINE__,
           dest_path.c_str());
    return KAVO::kErrNameTooLong;
  }
  return is_encrypted ? KAVO::kErrNameTooLongEncrypted : KAVO::kErrNameTooLong;
}

// A line buffer as getline grows it.
struct LineBuffer {
  LineBuffer() = default;
  ~LineBuffer() { std::free(text); }
  LineBuffer(const LineBuffer&) = delete;
  LineBuffer& operator=(const LineBuffer&) = delete;

  char* text = nullptr;
  std::size_t size = 0;
};

// Fills in the archive's full path and goes to the directory that the list is relative to.
bool PrepareArchiver(ZantroCompressHandler& handler, const _tag_CompressInfo_& info,
                     const char* user, char* archive_path) {
  PathInfo archive;
  if (PathInfoFactory::create(user, info.dest_path, archive) == 0) {
    syslog(LOG_ERR, "%s:%d Failed to get path info:%s, reason=[%X]", kLogSource, __LINE__,
           info.dest_path.c_str(), static_cast<unsigned int>(LumoLibGetErr()));
    handler.SetErrItem(info.dest_path, LumoLibGetErr());
    return false;
  }
  VolumeInfo volume = {};
  if (VolumePathParse(archive.volume_path.c_str(), &volume) < 0) {
    syslog(LOG_ERR, "%s:%d Failed to get volume info, %s", kLogSource, __LINE__,
           archive.volume_path.c_str());
    handler.SetErrItem(archive.volume_path, KAVO::kErrGeneral);
    return false;
  }
  if (chdir(info.work_dir.c_str()) == -1) {
    const int error = errno;
    syslog(LOG_ERR, "%s:%d Failed to chdir, reason=%s(%d)", kLogSource, __LINE__,
           std::strerror(error), error);
    handler.SetErrItem(info.work_dir, LumoParseErrnoToError(error, nullptr, nullptr));
    return false;
  }
  std::snprintf(archive_path, kArchivePathSize, "%s", archive.real_path.c_str());
  return true;
}

void RecordArchiverError(ZantroCompressHandler& handler, ArchiverError error, const char* line,
                         const std::string& dest_path) {
  switch (error) {
    case ArchiverError::kNoSpace:
      return handler.SetErrItem(dest_path, KAVO::kErrNoSpace);
    case ArchiverError::kQuota:
      return handler.SetErrItem(dest_path, KAVO::kErrQuota);
    case ArchiverError::kReadOnly:
      return handler.SetErrItem(dest_path, KAVO::kErrReadOnly);
    case ArchiverError::kNameTooLong:
      return handler.SetErrItem(dest_path, NameTooLongCode(dest_path));
    case ArchiverError::kUnknown:
      syslog(LOG_ERR, "%s:%d %s", kLogSource, __LINE__, line);
      return handler.SetErrItem(dest_path, KAVO::kErrGeneral);
  }
}

// Reads to the end of the output, or to the first error line. A read error counts as the end.
bool FollowArchiver(ZantroCompressHandler& handler, const _tag_CompressInfo_& info, FILE* output) {
  std::string current_file;
  std::uint64_t total_size = 0;
  LineBuffer line;
  ssize_t length = 0;
  while ((length = getline(&line.text, &line.size, output)) != -1) {
    const ArchiverEvent event = ParseArchiverLine({line.text, static_cast<std::size_t>(length)});
    switch (event.kind) {
      case ArchiverEvent::kTotal:
        total_size = event.total_size;
        WriteTaskProgress("", 0, total_size);
        break;
      case ArchiverEvent::kFile:
        current_file = event.file;
        break;
      case ArchiverEvent::kProgress:
        WriteTaskProgress(current_file, event.progress, total_size);
        break;
      case ArchiverEvent::kError:
        RecordArchiverError(handler, event.error, line.text, info.dest_path);
        return false;
      case ArchiverEvent::kOther:
        break;
    }
  }
  return true;
}

void SetArchiveMode(const char* archive_path, std::uint32_t saved_umask) {
  const mode_t mode =
      saved_umask == kNoSavedMask ? ~LumoLibGetUmask() & kArchiveMode : kArchiveMode;
  if (KAVOFSAclChmod(archive_path, kByPath, mode) < 0) {
    // The text says 777 whatever the mode, for those who search logs for it.
    syslog(LOG_ERR, "%s:%d failed to ACL chmod '%s' to 777, errno: %m", kLogSource, __LINE__,
           archive_path);
  }
}

// An administrator's archive goes to the administrators' group. What fails here leaves an item but
// no failed job.
void SetArchiveOwner(ZantroCompressHandler& handler, const char* archive_path, const char* user,
                     const std::string& dest_path) {
  const int is_admin = KLIBGroupIsAdminGroupMem(user, 0);
  if (is_admin == -1) {
    const auto error = static_cast<unsigned int>(KLIBCErrGet());
    const char* const file = KLIBCErrorGetFile();
    const int line = KLIBCErrorGetLine();
    syslog(LOG_ERR, "%s:%d KLIBGroupIsAdminGroupMem(%s) failed. [0x%04X %s:%d]", kLogSource,
           __LINE__, user, error, file, line);
    handler.SetErrItem(dest_path, KAVO::kErrSystem);
  } else if (is_admin == 1 && LumoLibChown2Admin(archive_path, user) != 0) {
    syslog(LOG_ERR, "%s:%d LumoLibChown2Admin fail", kLogSource, __LINE__);
    handler.SetErrItem(dest_path, KAVO::kErrSystem);
  }
}

}  // namespace

bool ZantroCompressHandler::LumoCompressFiles(const _tag_CompressInfo_& info, const char* user) {
  char archive_path[kArchivePathSize] = {};
  ArgumentVector arguments;
  std::unique_ptr<FILE, StreamCloser> output;
  bool succeeded = false;

  if (PrepareArchiver(*this, info, user, archive_path)) {
    AddArguments(info, archive_path, arguments);
    output.reset(KLIBCPopenv(kArchiverProgram, "r", arguments.Get(), 0));
    if (output == nullptr) {
      syslog(LOG_ERR, "%s:%d KLIBCPopenv failed", kLogSource, __LINE__);
      SetErrItem(info.dest_path, KAVO::kErrGeneral);
    } else if (FollowArchiver(*this, info, output.get())) {
      SetArchiveMode(archive_path, saved_umask);
      succeeded = true;
    }
  }
  if (access(archive_path, F_OK) == 0) {
    SetArchiveOwner(*this, archive_path, user, info.dest_path);
    KLIBKavoIndexAdd(archive_path, kIndexSingleFile);
  }
  return succeeded;  // the list file goes next, with its owner
}

std::string ZantroCompressHandler::LumoEscape(const char* text) {
  constexpr std::size_t kGrowth = 3;  // each byte quoted, at the worst
  const std::size_t size = kGrowth * std::strlen(text) + 1;
  const std::unique_ptr<char, decltype(&std::free)> buffer(static_cast<char*>(std::calloc(size, 1)),
                                                           &std::free);
  if (buffer == nullptr) {
    syslog(LOG_ERR, "%s:%d Failed to malloc: (%d)", kLogSource, __LINE__, static_cast<int>(size));
    return {};
  }
  if (KLIBCEncShParam(text, buffer.get(), size) < 0) {
    syslog(LOG_ERR, "%s:%d Failed to escape string: %s", kLogSource, __LINE__, text);
    return {};
  }
  return buffer.get();
}

}  // namespace Zantro
