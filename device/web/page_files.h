// The page's files, read once.
#pragma once

#include <map>
#include <string>

namespace Web {

struct PageFile {
  std::string content;
  std::string content_type;
};

// Every file of the folder by its URL path; index.html is "/". Throws std::runtime_error that names
// the file and the reason.
std::map<std::string, PageFile> ReadPageFiles(int folder);

}  // namespace Web
