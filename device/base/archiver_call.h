// What the archiver is told beside its argument list, which every user of the machine can read: on
// its standard input, a socket.
//
// There it gets one frame: texts, each with a zero byte behind it, in the order of the fields
// below, and zero bytes to the next multiple of 8192. Back comes one message with a descriptor, the
// archive that was made (opened as a path, O_PATH), before the run ends well.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "device/base/file_descriptor.h"

namespace Device {

// What the archiver needs beside itself: files in its own folder.
inline constexpr char kZipProgramName[] = "kavo-zip";
inline constexpr char kLinkFreeName[] = "kavo-link-free.so";

struct ArchiverCall {
  std::string password;                    // empty for none
  std::string work_folder;                 // name of the hidden folder to make beside the target
  int zip_program = -1;                    // kavo-zip, open in the archiver under this number
  int link_free = -1;                      // likewise kavo-link-free.so
  std::uint64_t memory = 0;                // bytes that 7z may take
  std::vector<std::string> fixed_folders;  // see OpenUserPath
};

// Before the archiver runs. False, with errno, when it cannot: E2BIG for more than an argument list
// can hold.
bool SendArchiverCall(int socket, const ArchiverCall& call);
// Nothing when what comes is no call.
std::optional<ArchiverCall> ReceiveArchiverCall(int socket);

// False when the other side is gone.
bool SendMadeArchive(int socket, const FileDescriptor& archive);
// Invalid when none was made.
FileDescriptor ReceiveMadeArchive(int socket);

}  // namespace Device
