// The error codes of the device's libraries, and the channel that LumoLibGetErr reads.
#pragma once

#include <map>
#include <string>

namespace Device {

enum LibraryError : int {
  kErrInternal = 100,      // the host's: the module failed without an outcome
  kErrBadParameter = 101,  // the host's: a value that does not convert
  kErrNoApi = 102,         // the host's: no such API
  kErrNoMethod = 103,      // the host's: no such method of the API
  kErrNoVersion = 104,     // the host's: the method has no such version
  kErrSystem = 401,        // any system error without a code of its own
  kErrSession = 402,       // the session has ended or is another user's
  kErrNoUser = 403,        // no such user
  kErrNoPrivilege = 407,
  kErrNotFound = 408,  // no such file, folder or shared folder
  kErrReadOnly = 411,
  kErrNameTooLong = 412,
  kErrNameTooLongCrypt = 413,
  kErrQuota = 415,
  kErrNoSpace = 416,
  kErrBadName = 418,       // a name that no file can have
  kErrOutsideShare = 419,  // a path that leads out of its shared folder or off the volumes
  kErrNoTask = 599,
  kErrArchive = 1300,  // the archive could not be made
  kErrArchiveName = 1301
};

// Leaves the code for LumoLibGetErr.
void SetLastError(int code);
// Leaves the code for a system error number.
void SetLastErrno(int error_number);

// What a web API error code means, in English. Never null.
const char* ErrorText(int code);
// All of them.
std::map<int, std::string> ErrorTexts();

}  // namespace Device
