// The page's files, read once.
#pragma once

#include <map>
#include <string>

namespace Web {

struct PageFile {
  std::string content;
  std::string content_type;
};

struct PageFiles {
  std::string version;                    // changes with any of them
  std::map<std::string, PageFile> files;  // by URL path
};

// Every file of the folder. index.html is "/"; the others lie below the version, under which
// index.html names them, so that who has them need never ask for them again. Throws
// std::runtime_error that names the file and the reason.
PageFiles ReadPageFiles(int folder);

}  // namespace Web
