#include "device/web/page_files.h"

#include <filesystem>
#include <functional>
#include <map>
#include <regex>
#include <stdexcept>
#include <string>
#include <utility>

#include "device/base/file_io.h"
#include "device/base/open_below.h"
#include "device/host/wire.h"

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

void AddPage(httplib::Server& server, int folder) {
  std::map<fs::path, std::string> files;
  for (const auto& entry : fs::directory_iterator(Device::PathOf(folder))) {
    files[entry.path().filename()] = Device::ReadTextFile(entry.path().string());
  }
  std::string all;
  for (const auto& [name, content] : files) {
    all.append(name).append(content);
  }
  const std::string version = std::to_string(std::hash<std::string>()(all));
  for (auto& [name, content] : files) {
    const bool is_index = name == kIndex;
    if (is_index) {
      static const std::regex kFileUrl("(href|src)=\"/(?=[a-z])");
      content = std::regex_replace(content, kFileUrl, "$1=\"/" + version + "/");
    }
    // A pattern: but for the dot of the ending, names are letters and hyphens.
    const std::string path =
        is_index ? "/"
                 : "/" + version + "/" + name.stem().string() + "\\" + name.extension().string();
    server.Get(path, [content = content, type = ContentType(name.extension()), is_index,
                      validator = "W/\"" + version + "\""](const httplib::Request& request,
                                                           httplib::Response& response) {
      response.headers.erase("Cache-Control");
      response.set_header("Cache-Control", is_index ? "no-cache" : "max-age=31536000, immutable");
      response.set_header("Vary", "Accept-Encoding");
      response.set_header("ETag", validator);
      if (request.get_header_value("If-None-Match").find(validator) != std::string::npos) {
        response.status = Device::kHttpNotModified;
      } else {
        response.set_content(content, type);
      }
    });
  }
}

}  // namespace Web
