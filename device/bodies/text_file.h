// Whole files as text.
#ifndef DEVICE_BODIES_TEXT_FILE_H_
#define DEVICE_BODIES_TEXT_FILE_H_

#include <string>

namespace Device {

// Throws std::runtime_error that names the file and the reason.
std::string ReadTextFile(const std::string& path);

}  // namespace Device

#endif  // DEVICE_BODIES_TEXT_FILE_H_
