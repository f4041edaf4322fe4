#include "device/archiver/failure.h"

#include <algorithm>
#include <cstring>

namespace Archiver {

Failure SystemFailure(const std::string& operation, const std::string& object, int error) {
  return NamedFailure(operation, object, std::strerror(error));
}

Failure NamedFailure(const std::string& operation, const std::string& object,
                     const std::string& reason) {
  return Failure(operation + " '" + NameInError(object) + "': " + reason);
}

std::string Printable(const std::string& text) {
  std::string result;
  result.reserve(text.size());
  for (size_t i = 0; i < text.size(); ++i) {
    const auto byte = static_cast<unsigned char>(text[i]);
    const auto next = static_cast<unsigned char>(i + 1 < text.size() ? text[i + 1] : '\0');
    if (byte == 0xC2 && next >= 0x80 && next < 0xA0) {  // U+0080..U+009F, terminal controls too
      result += '?';
      ++i;
    } else {
      result += byte < 0x20 || byte == 0x7F ? '?' : text[i];
    }
  }
  return result;
}

std::string NameInError(const std::string& name) {
  static constexpr const char* kMeaningful[] = {"Error:", "No space left on device",
                                                "Disk quota exceeded", "Read-only file system",
                                                "File name too long"};
  std::string result = Printable(name);
  for (const char* text : kMeaningful) {
    for (size_t at = result.find(text); at != std::string::npos; at = result.find(text, at)) {
      const auto begin = result.begin() + static_cast<std::ptrdiff_t>(at);
      std::replace_if(
          begin, begin + static_cast<std::ptrdiff_t>(std::strlen(text)),
          [](char c) { return c == ' ' || c == ':'; }, '_');
    }
  }
  return result;
}

}  // namespace Archiver
