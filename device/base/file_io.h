// Whole reads and writes, frames, standard streams.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "device/base/file_descriptor.h"

namespace Device {

// Puts /dev/null in the place of the standard streams that are closed, so that nothing opened later
// gets their numbers.
void OccupyStandardStreams();

// A file beside the program's own, opened with the flags. Throws std::system_error that names it.
FileDescriptor OpenBesideProgram(const std::string& name, int flags);

// A file's text. Throws std::runtime_error that names the file and the reason.
std::string ReadTextFile(const std::string& path);

// Writes all of the bytes, waiting where that takes long. False, with errno, when it cannot.
bool WriteAll(int fd, std::string_view bytes);

// Fills the buffer. False when the input ends before, or fails.
bool ReadAll(int fd, char* to, std::size_t size);

// Frames on a stream: a length, then so many bytes. A reader knows the end of a frame by its length
// and need not wait until all who hold the other end have closed it.
inline constexpr std::size_t kMostFrameBytes = std::size_t{256} << 20U;

// False when the other side is gone.
bool WriteFrame(int fd, const std::string& text);

// Nothing when the other side is gone without a whole frame, or the frame is too long.
std::optional<std::string> ReadFrame(int fd);
// The same, when the frame's bytes are to be read by ReadAll.
std::optional<std::size_t> ReadFrameLength(int fd);

}  // namespace Device
