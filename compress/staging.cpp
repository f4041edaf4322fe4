// Worker step: stages the list of entries to pack, and with it their names in the archive.
//
// Sources of one shared folder are named relative to their common parent. Sources of several shared
// folders are named from the shared folder down, through a directory of links, so that the archive
// holds one folder for each of them.
//
// While this step runs the record's dest_path is still empty, and so is the path of the error items
// that name it, as clients of the device know them.
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <map>
#include <string>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/list_line.h"
#include "platform/kavo/error_codes.h"
#include "platform/klib/system.h"
#include "platform/lumo/file_manager.h"

namespace Zantro {

namespace {

constexpr char kTempTemplate[] = "/tmp/lumozipXXXXXX";
constexpr char kRemoveProgram[] = "/bin/rm";
constexpr unsigned int kExeclRunAndWait = 187;

class FileDescriptor {
 public:
  explicit FileDescriptor(int fd) : fd_(fd) {}
  ~FileDescriptor() {
    if (fd_ > 0) {  // 0 is left open: it stands for a closed standard input, not for a list
      close(fd_);
    }
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;

  int Get() const { return fd_; }

 private:
  int fd_;
};

// False when the line was not written whole.
template <std::size_t kBufferSize>
bool WriteLine(int fd, const ListLine<kBufferSize>& line) {
  return write(fd, line.Text(), line.Length()) == line.Length();
}

void RemoveStagingDirectory(const char* directory) {
  struct stat status {};
  if (stat(directory, &status) == 0) {
    KLIBCExecl(kRemoveProgram, kExeclRunAndWait, "-rf", directory, static_cast<char*>(nullptr));
  }
}

void RefuseSource(ZantroCompressHandler& handler, const PathInfo& source) {
  syslog(LOG_ERR, "%s:%d Name is too long for tempzip or holds a line feed: %s", kLogSource,
         __LINE__, source.share_path.c_str());
  handler.SetErrItem(source.share_path, KAVO::kErrGeneral);
}

// `list_file` is a template of mkstemp's and is filled in.
bool WriteList(ZantroCompressHandler& handler, const _tag_CompressInfo_& info,
               const std::string& parent, char* list_file) {
  const FileDescriptor list(mkstemp(list_file));
  if (list.Get() == -1) {
    syslog(LOG_ERR, "%s:%d Failed to mkstemp %s", kLogSource, __LINE__, kTempTemplate);
    handler.SetErrItem(info.dest_path, KAVO::kErrGeneral);
    return false;
  }
  for (const PathInfo& source : info.path_infos) {
    // All of the parent but its "/", which begins the name. Throws out_of_range when the source
    // does not lie below the parent.
    const ListLine<kListLineSize> line(source.real_path.substr(parent.size() - 1));
    if (!line.IsExpressible()) {
      RefuseSource(handler, source);
      return false;
    }
    if (!WriteLine(list.Get(), line)) {
      syslog(LOG_ERR, "%s:%d Failed to write %s to tempzip", kLogSource, __LINE__, line.Text());
      handler.SetErrItem(info.dest_path, KAVO::kErrGeneral);
      return false;
    }
  }
  return true;
}

// Links the source's shared folder into the current directory, once for all of its sources.
bool LinkShare(ZantroCompressHandler& handler, const PathInfo& source) {
  const char* const target = source.share_real_path.c_str();
  const char* const link = source.share_name.c_str();
  struct stat status {};
  if (lstat(link, &status) == 0 || symlink(target, link) == 0) {
    return true;
  }
  const int error = errno;
  syslog(LOG_ERR, "%s:%d Failed to link the file from %s to %s.", kLogSource, __LINE__, target,
         link);
  handler.SetErrItem(source.share_real_path, LumoParseErrnoToError(error, nullptr, nullptr));
  return false;
}

bool FillStagingDirectory(ZantroCompressHandler& handler, const _tag_CompressInfo_& info,
                          const char* directory, char* list_file) {
  if (chdir(directory) != 0) {
    syslog(LOG_ERR, "%s:%d Failed to chdir %s.", kLogSource, __LINE__, directory);
    handler.SetErrItem(info.dest_path, KAVO::kErrGeneral);
    return false;
  }
  const FileDescriptor list(mkstemp(list_file));
  if (list.Get() < 0) {
    syslog(LOG_ERR, "%s:%d Failed to create a temp file.", kLogSource, __LINE__);
    handler.SetErrItem(info.dest_path, KAVO::kErrGeneral);
    return false;
  }
  for (const PathInfo& source : info.path_infos) {
    if (!LinkShare(handler, source)) {
      return false;
    }
    const ListLine<kStagedListLineSize> line(source.share_path);
    if (!line.IsExpressible()) {
      RefuseSource(handler, source);
      return false;
    }
    if (!WriteLine(list.Get(), line)) {
      syslog(LOG_ERR, "%s:%d Failed to write tempzip", kLogSource, __LINE__);
      handler.SetErrItem(info.dest_path, KAVO::kErrGeneral);
      return false;
    }
  }
  return true;
}

}  // namespace

bool ZantroCompressHandler::SaveZipFileListToTmp(_tag_CompressInfo_& info) {
  std::map<std::string, bool> shares;
  for (const PathInfo& source : info.path_infos) {
    shares.emplace(source.share_name, true);
  }
  if (shares.size() >= 2) {
    return GenerateZipListWithShare(info);
  }
  return GenerateZipList(info, FindCommonParent(info.src_dirs));
}

bool ZantroCompressHandler::GenerateZipList(_tag_CompressInfo_& info, const std::string& parent) {
  std::string list_file = kTempTemplate;
  if (!WriteList(*this, info, parent, list_file.data())) {
    unlink(list_file.c_str());
    return false;
  }
  info.work_dir = parent;
  info.list_file = list_file;
  return true;
}

// On success the directory and its links are left behind, as on the device, where others clear
// /tmp; the process stays in the directory.
bool ZantroCompressHandler::GenerateZipListWithShare(_tag_CompressInfo_& info) {
  std::string directory = kTempTemplate;
  if (mkdtemp(directory.data()) == nullptr) {
    syslog(LOG_ERR, "%s:%d Failed to create a temp directory.", kLogSource, __LINE__);
    SetErrItem(info.dest_path, KAVO::kErrGeneral);
    return false;
  }
  char list_file[] = "lumozipXXXXXX";
  if (!FillStagingDirectory(*this, info, directory.c_str(), list_file)) {
    RemoveStagingDirectory(directory.c_str());
    return false;
  }
  info.work_dir = directory;
  info.list_file = directory + "/" + list_file;
  return true;
}

}  // namespace Zantro
