// Frames on a stream: a length, then so many bytes. Who else still holds the stream's other end
// does not matter to a reader then.
#pragma once

#include <cstddef>
#include <optional>
#include <string>

namespace Device {

inline constexpr std::size_t kMostFrameBytes = std::size_t{256} << 20U;

// False when the other side is gone.
bool WriteFrame(int fd, const std::string& text);

// Nothing when the other side is gone without a whole frame, or the frame is too long.
std::optional<std::string> ReadFrame(int fd);

}  // namespace Device
