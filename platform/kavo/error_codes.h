// The web API's error codes, as the host, the device's libraries and the modules use them. The host
// reports them as they are; 0 is success.
#pragma once

namespace KAVO {

enum ErrorCode : int {
  kErrInternal = 100,      // the request failed without an outcome
  kErrBadParameter = 101,  // bad or missing parameter, unknown method
  kErrNoApi = 102,
  kErrNoMethod = 103,
  kErrNoVersion = 104,  // the method has no such version
  kErrSystem = 401,     // a system error without a code of its own; a task or owner not dealt with
  kErrSession = 402,    // the session has ended or is another user's
  kErrNoUser = 403,     // no such user
  kErrNoPrivilege = 407,
  kErrNotFound = 408,  // no such file, folder or shared folder
  kErrReadOnly = 411,  // read-only file system
  kErrNameTooLong = 412,
  kErrNameTooLongEncrypted = 413,  // on an encrypted shared folder
  kErrQuota = 415,                 // disk quota exceeded
  kErrNoSpace = 416,               // no space left on device
  kErrBadName = 418,               // a name that no file can have
  kErrOutsideShare = 419,          // a path that leads out of its shared folder or off the volumes
  kErrNoTask = 599,
  kErrGeneral = 1300,            // fork, task update, list or staging file, archiver
  kErrArchiveNameTooLong = 1301  // archive name longer than a file system takes
};

}  // namespace KAVO
