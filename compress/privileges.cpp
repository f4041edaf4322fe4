// Worker steps: may the user make the archive there, and read every source?
#include <sys/stat.h>
#include <syslog.h>

#include <cerrno>
#include <map>
#include <string>

#include "compress/KAVO.Zantro.Compress.h"
#include "compress/split_path.h"
#include "platform/kavo/error_codes.h"
#include "platform/lumo/file_manager.h"

namespace Zantro {

namespace {

constexpr char kPathCharset[] = "UTF-8";
constexpr int kPrivilegeWrite = 2;  // the one level that suffices for the destination
constexpr int kFlagWriteSuspended = 0x2;
constexpr int kCheckPathFlags = 32;
constexpr int kAccessWrite = 2;
constexpr int kAccessFile = 1;
constexpr int kAccessDirectory = 5;

bool IsAcceptablePath(const char* path) {
  return LumoCheckPath(path, false, kCheckPathFlags, nullptr, true, false, nullptr) == 0;
}

// The shared folder's privilege.
bool CheckDestShare(ZantroCompressHandler& handler, const char* dest, const char* user,
                    const char* session_id) {
  int level = 0;
  int flags = 0;
  if (LumoLibGetPrivilege(dest, user, session_id, &level, &flags) != 0) {
    syslog(LOG_ERR, "%s:%d compress dest no privilege, reason[%d]", kLogSource, __LINE__,
           LumoLibGetErr());
    handler.SetErrItem(dest, LumoLibGetErr());
    return false;
  }
  if (level != kPrivilegeWrite || (flags & kFlagWriteSuspended) != 0) {
    handler.SetErrItem(dest, KAVO::kErrNoPrivilege);  // the worker's line alone is logged
    return false;
  }
  return true;
}

// The directory that is to hold the archive, and the archive's name.
bool CheckDestDirectory(ZantroCompressHandler& handler, const char* dest,
                        const std::string& full_path) {
  const SplitPath split(full_path);
  const char* const directory = split.Directory();
  if (!IsAcceptablePath(directory)) {
    syslog(LOG_ERR, "%s:%d invalid path %s, err=%d", kLogSource, __LINE__, directory,
           LumoLibGetErr());
    handler.SetErrItem(directory, LumoLibGetErr());
    return false;
  }
  if (ACLAccess(directory, kAccessWrite) != 0) {
    syslog(LOG_ERR, "%s:%d Can't access %s, err=%d ", kLogSource, __LINE__, directory,
           LumoLibGetErr());
    handler.SetErrItem(directory, LumoLibGetErr());
    return false;
  }
  if (LumoCheckFileName(directory, split.Name()) < 0) {
    syslog(LOG_ERR, "%s:%d Failed to check filename: path=%s file name = %s reason=[%d] ",
           kLogSource, __LINE__, directory, split.Name(), LumoLibGetErr());
    handler.SetErrItem(dest, LumoLibGetErr());
    return false;
  }
  return true;
}

// Records the item, unless the code is 0.
void SetSourceErrItem(ZantroCompressHandler& handler, const PathInfo& source, int code) {
  if (code != 0) {
    handler.SetErrItem(source.share_path, code);
  }
}

// False when the user may not list the source's shared folder: reported as an item, but no failure
// of the check, as what the user knows by name may be readable.
bool MayListShare(ZantroCompressHandler& handler, const KAVO::APIRequest& request,
                  const std::string& user, const PathInfo& source) {
  const std::string session_id = request.GetSessionID();
  if (CheckShareListPrivilege(user.c_str(), session_id.c_str(), source.share_path.c_str()) == 0) {
    syslog(LOG_ERR, "%s:%d No share privilege to list path %s", kLogSource, __LINE__,
           source.share_path.c_str());
    handler.SetErrItem(source.share_path, KAVO::kErrNoPrivilege);
    return false;
  }
  return true;
}

// False when the source counts as failed.
bool CheckAccess(ZantroCompressHandler& handler, const PathInfo& source) {
  const char* const path = source.real_path.c_str();
  struct stat status {};
  if (stat(path, &status) != 0) {
    SetSourceErrItem(handler, source, LumoParseErrnoToError(errno, nullptr, nullptr));
    return false;
  }
  if (ACLAccess(path, S_ISDIR(status.st_mode) ? kAccessDirectory : kAccessFile) != 0) {
    SetSourceErrItem(handler, source, LumoLibGetErr());
    return false;
  }
  return true;
}

}  // namespace

// The first failing test ends the check, with one error item. What concerns the directory names its
// full path in the item, all else the user's own text: clients show the one and the other so.
int ZantroCompressHandler::CheckDestPriv(const char* dest, const char* user,
                                         const char* session_id) {
  std::string full_path;
  std::string home_test_path;
  std::string unused_1;
  std::string unused_2;
  const std::string user_name(user);
  if (LumoFullPathGet(dest, &full_path, &home_test_path, &unused_1, &unused_2, &user_name,
                      kPathCharset) == 0) {
    syslog(LOG_ERR, "%s:%d Failed to get path info: %s, err=%d", kLogSource, __LINE__, dest,
           LumoLibGetErr());
    SetErrItem(dest, LumoLibGetErr());
    return 0;
  }
  // The user's own home needs no privilege query.
  if (IsDirUserHome(home_test_path, nullptr) == 0 &&
      !CheckDestShare(*this, dest, user, session_id)) {
    return 0;
  }
  return CheckDestDirectory(*this, dest, full_path) ? 1 : 0;
}

// Every source is examined, so that the user sees all that is wrong at once.
int ZantroCompressHandler::CheckSourcePrivilege(const _tag_CompressInfo_& info) {
  std::map<std::string, bool> checked_shares;  // one question for each shared folder
  int failed = 0;
  for (const PathInfo& source : info.path_infos) {
    if (!IsAcceptablePath(source.real_path.c_str())) {
      SetSourceErrItem(*this, source, LumoLibGetErr());
      ++failed;
      continue;
    }
    const bool is_new_share = checked_shares.emplace(source.share_name, true).second;
    if (is_new_share && !MayListShare(*this, *request, login_user, source)) {
      continue;  // neither looked at nor tested for access; later sources of the share are
    }
    if (!CheckAccess(*this, source)) {
      ++failed;
    }
  }
  return failed == 0 ? 1 : 0;
}

}  // namespace Zantro
