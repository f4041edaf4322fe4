#pragma once

#include "device/archiver/command_line.h"
#include "device/base/file_descriptor.h"

namespace Archiver {

// Throws Failure for a password which 7z cannot take for this request.
void CheckPassword(const Request& request);

// A standard input for 7z that answers its questions for the password; invalid when there is none.
Device::FileDescriptor PasswordInput(const Request& request);

// An unnamed file that holds `text`, positioned at its start.
Device::FileDescriptor UnnamedFile(const std::string& text);

}  // namespace Archiver
