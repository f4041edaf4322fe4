#include "device/base/code_page.h"

#include <strings.h>

#include <algorithm>
#include <cctype>

namespace Device {
namespace {

constexpr char kUtf8[] = "UTF-8";

iconv_t Unopened() { return reinterpret_cast<iconv_t>(-1); }  // NOLINT(performance-no-int-to-ptr)

// iconv takes options after a slash, more charsets after a comma, and nothing for the locale's.
bool IsCharsetName(const std::string& name) {
  return std::isalnum(static_cast<unsigned char>(name[0])) != 0 &&
         std::all_of(name.begin(), name.end(), [](unsigned char c) {
           return std::isalnum(c) != 0 || c == '-' || c == '_' || c == '.' || c == ':';
         });
}

std::string IconvName(const std::string& name) {
  if (!IsCharsetName(name)) {
    return "none such";
  }
  const bool number = name.find_first_not_of("0123456789") == std::string::npos;
  return number ? "CP" + name : name;
}

std::optional<std::string> Convert(iconv_t converter, std::string text) {
  std::string result(text.size() * 4 + 16, '\0');
  char* in = text.data();
  size_t in_left = text.size();
  char* out = result.data();
  size_t out_left = result.size();
  iconv(converter, nullptr, nullptr, nullptr, nullptr);
  // Any result but 0 means characters that were replaced, or could not be.
  if (iconv(converter, &in, &in_left, &out, &out_left) != 0 ||
      iconv(converter, nullptr, nullptr, &out, &out_left) != 0) {
    return std::nullopt;
  }
  result.resize(result.size() - out_left);
  return result;
}

}  // namespace

CodePage::CodePage(const std::string& name)
    : encoder_(iconv_open(IconvName(name).c_str(), kUtf8), iconv_close),
      decoder_(iconv_open(kUtf8, IconvName(name).c_str()), iconv_close) {}

std::unique_ptr<CodePage> CodePage::Open(const std::string& name) {
  const std::string path = "/ABCXYZabcxyz0189.-_+@";
  std::unique_ptr<CodePage> page(new CodePage(name));
  const bool is_known = page->encoder_.get() != Unopened() && page->decoder_.get() != Unopened();
  return is_known && page->Encode(path) == path ? std::move(page) : nullptr;
}

std::optional<std::string> CodePage::Encode(const std::string& utf8) const {
  std::optional<std::string> bytes = Convert(encoder_.get(), utf8);
  // Some code pages have characters with a byte that would part the name where it has no part.
  const auto parts = [](const std::string& name) {
    return std::count(name.begin(), name.end(), '/') + std::count(name.begin(), name.end(), '\0');
  };
  const bool is_held =
      bytes && Convert(decoder_.get(), *bytes) == utf8 && parts(*bytes) == parts(utf8);
  return is_held ? bytes : std::nullopt;
}

std::optional<std::string> CodePage::Decode(const std::string& bytes) const {
  return Convert(decoder_.get(), bytes);
}

bool CodePage::IsUtf8(const std::string& name) {
  return name.empty() || strcasecmp(name.c_str(), kUtf8) == 0 ||
         strcasecmp(name.c_str(), "UTF8") == 0 || strcasecmp(name.c_str(), "CP65001") == 0 ||
         name == "65001";
}

}  // namespace Device
