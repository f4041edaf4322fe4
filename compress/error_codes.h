// The web API error codes that this API sets itself; those of the file manager's library are passed
// on as they come.
#pragma once

namespace Zantro {

enum ErrorCode : int {
  kErrBadParameter = 101,        // bad or missing parameter, unknown method
  kErrTask = 401,                // task not created, read or killed; ownership not fixed
  kErrNoPrivilege = 407,         // on the destination or on a source's shared folder
  kErrReadOnly = 411,            // read-only file system
  kErrNameTooLong = 412,         // file name too long
  kErrNameTooLongCrypt = 413,    // file name too long on an encrypted shared folder
  kErrQuota = 415,               // disk quota exceeded
  kErrNoSpace = 416,             // no space left on device
  kErrNoTask = 599,              // no such task
  kErrGeneral = 1300,            // fork, task update, list or staging file, archiver
  kErrArchiveNameTooLong = 1301  // archive name longer than a file system takes
};

}  // namespace Zantro
