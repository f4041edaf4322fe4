// Whole files as text.
#pragma once

#include <string>

namespace Device {

// Throws std::runtime_error that names the file and the reason.
std::string ReadTextFile(const std::string& path);

}  // namespace Device
