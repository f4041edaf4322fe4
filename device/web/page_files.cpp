#include "device/web/page_files.h"

#include <filesystem>
#include <stdexcept>

#include "device/base/file_io.h"

namespace Web {

namespace {

namespace fs = std::filesystem;

constexpr char kIndex[] = "index.html";

std::string ContentType(const std::string& extension) {
  static const std::map<std::string, std::string> kTypes = {
      {".html", "text/html; charset=utf-8"},
      {".css", "text/css; charset=utf-8"},
      {".js", "text/javascript; charset=utf-8"},
      {".svg", "image/svg+xml"}};
  const auto found = kTypes.find(extension);
  if (found == kTypes.end()) {
    throw std::runtime_error("page: no content type for '" + extension + "'");
  }
  return found->second;
}

}  // namespace

std::map<std::string, PageFile> ReadPageFiles(int folder) {
  std::map<std::string, PageFile> files;
  for (const auto& entry : fs::directory_iterator("/proc/self/fd/" + std::to_string(folder))) {
    const std::string name = entry.path().filename().string();
    files[name == kIndex ? "/" : "/" + name] = {Device::ReadTextFile(entry.path().string()),
                                                ContentType(entry.path().extension().string())};
  }
  return files;
}

}  // namespace Web
