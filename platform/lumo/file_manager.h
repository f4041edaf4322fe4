// The file manager's library: identity, errors, paths and privileges on shared folders.
//
// Its error channel: an operation that fails says so in its result and leaves a web API error code
// for LumoLibGetErr, unless its comment says otherwise. Paths are bytes as the file system has
// them. "User path" means the path as users see it, rooted at a shared folder (/photo/trip);
// "full path" means the path on the volume.
#pragma once

#include <json/json.h>

#include <cstdint>
#include <string>
#include <vector>

// ---- Errors

// The library's last error in this process, as a web API error code; 0 when there was none.
int LumoLibGetErr();
// The web API error code for a system error number; 0 for 0. The texts name what was worked on and
// may be null.
int LumoParseErrnoToError(int error_number, const char* source, const char* destination);
// The desktop's text for a web API error code. Static storage, never null. The second argument is
// 0.
const char* LumoParseErrorToVeskString(int code, int reserved);

// ---- Identity and file-creation mask of the process

// Takes on the user's uid, gid and groups. A session id that is given (neither null nor empty)
// must be a living one of that user. Negative on failure, 0 or more on success.
int LumoLibUGIDSet(const char* session_id, const char* user);
// Sets the mask that the file manager works under and returns the value to restore later.
std::uint32_t LumoLibUmask();
void LumoLibRestoreUmask(std::uint32_t saved);
// The process's present mask.
std::uint32_t LumoLibGetUmask();

// ---- Paths

// One resolved path. Exactly these seven texts in this order: the layout is shared with the
// library.
struct PathInfo {
  std::string share_path;       // user path: /share/dir/name
  std::string aux_1;            // filled by the factory; no caller here reads it
  std::string real_path;        // full path: /vol1/share/dir/name
  std::string share_name;       // share
  std::string volume_path;      // /vol1
  std::string share_real_path;  // /vol1/share
  std::string aux_6;            // filled by the factory; no caller here reads it
};

class PathInfoFactory {
 public:
  // Resolves a user path as that user sees it and fills all seven fields. The path itself need not
  // exist. Non-zero on success, 0 on failure.
  static int create(const char* user, const std::string& path, PathInfo& out);
};

// Resolves a user path into its full path, the full path to ask IsDirUserHome about, and two more
// texts. `charset` names the encoding of `path`. Non-zero on success, 0 on failure.
int LumoFullPathGet(const char* path, std::string* full_path, std::string* home_test_path,
                    std::string* aux_1, std::string* aux_2, const std::string* user,
                    const char* charset);
// Non-zero when the full path is, or lies in, the home of the user whose identity the process has.
// The second argument is null. No error channel.
int IsDirUserHome(const std::string& path, const char* reserved);
// Tests whether a full path may be worked on: it must lie on the device's volumes, also after links
// are followed. Called with (path, false, 32, null, true, false, null); what the others would ask
// for is the library's own. 0 when acceptable, non-zero otherwise.
int LumoCheckPath(const char* path, bool option_1, int flags, std::string* out, bool option_2,
                  bool option_3, const char* reserved);
// Tests whether a file of that name may be made in the directory (full path): allowed characters
// and length. The name is bytes. 0 or more when valid, negative otherwise.
int LumoCheckFileName(const char* directory, const char* name);
// The deepest directory that holds every one of the directories; all end in "/", as does the
// result ("/" when they share no other). "/" for an empty vector. No failure.
std::string FindCommonParent(std::vector<std::string> directories);

struct VolumeInfo {
  std::uint32_t words[2];
};
// Tells which volume a volume path is. Negative when it is none.
int VolumePathParse(const char* volume_path, VolumeInfo* out);

// ---- Privileges

// The user's privilege on the shared folder of a user path: level 2 may write, 1 may read, 0 none;
// flag bit 0x2: writing is suspended on that folder. 0 on success, non-zero on failure.
int LumoLibGetPrivilege(const char* path, const char* user, const char* session_id, int* level,
                        int* flags);
// Non-zero when the user may list that user path's shared folder, 0 when not. No error channel.
int CheckShareListPrivilege(const char* user, const char* session_id, const char* path);
// Access test on a full path under the process's effective identity, access lists included. Mode is
// a sum of 1 (read or list), 2 (write), 4 (run or pass through). 0 when granted, non-zero
// otherwise.
int ACLAccess(const char* path, int mode);
// Tells whether a user path lies on an encrypted shared folder. Zero on failure.
int LumoLibCheckEncryptShare(const std::string& path, bool* encrypted);
// Gives a file (full path) to the user and the administrators' group. Non-zero on failure.
int LumoLibChown2Admin(const char* path, const char* user);

// ---- Texts

// Splits a request parameter into a JSON array of texts, by the rules of that API version: a text
// at the separators, empty pieces left out. An empty array when the value is nothing that can be
// split. The last argument is false.
Json::Value StringExplodeEx(const Json::Value& value, const std::string& separator, int version,
                            bool reserved);

namespace WebUtils {
// The text with the characters that mean something in HTML replaced by references. The second
// argument, false here, asks to replace blanks too.
std::string EncodeHtml(const std::string& text, bool encode_blanks);
}  // namespace WebUtils
