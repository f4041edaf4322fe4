// Names in a character set other than UTF-8.
#pragma once

#include <iconv.h>

#include <memory>
#include <optional>
#include <string>

namespace Device {

// A character set that agrees with ASCII on what makes a path, by its IANA name or as "CPnnn" or
// "nnn".
class CodePage {
 public:
  // Null for a name that is unknown or cannot serve in file names.
  static std::unique_ptr<CodePage> Open(const std::string& name);

  // Nothing when `utf8` cannot go to the code page and come back unchanged.
  std::optional<std::string> Encode(const std::string& utf8) const;
  std::optional<std::string> Decode(const std::string& bytes) const;

  // Whether names stand as they are: no code page given, or UTF-8.
  static bool IsUtf8(const std::string& name);

 private:
  explicit CodePage(const std::string& name);

  using Converter = std::unique_ptr<void, int (*)(iconv_t)>;
  Converter encoder_;
  Converter decoder_;
};

}  // namespace Device
