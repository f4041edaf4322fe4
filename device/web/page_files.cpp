#include "device/web/page_files.h"

#include <filesystem>
#include <functional>
#include <regex>
#include <stdexcept>
#include <utility>

#include "device/base/file_io.h"
#include "device/base/open_below.h"

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

PageFiles ReadPageFiles(int folder) {
  std::map<std::string, PageFile> by_name;
  std::string all;
  for (const auto& entry : fs::directory_iterator(Device::PathOf(folder))) {
    by_name[entry.path().filename().string()] = {Device::ReadTextFile(entry.path().string()),
                                                 ContentType(entry.path().extension().string())};
  }
  for (const auto& [name, file] : by_name) {
    all.append(name).append(file.content);
  }
  PageFiles page{std::to_string(std::hash<std::string>()(all)), {}};
  for (auto& [name, file] : by_name) {
    if (name == kIndex) {
      static const std::regex kFileUrl("(href|src)=\"/(?=[a-z])");
      file.content = std::regex_replace(file.content, kFileUrl, "$1=\"/" + page.version + "/");
    }
    page.files[name == kIndex ? "/" : "/" + page.version + "/" + name] = std::move(file);
  }
  return page;
}

}  // namespace Web
