#pragma once

#include <string>
#include <utility>
#include <vector>

namespace Archiver {

// The symbolic links among and below `sources`, which are relative to the working directory. The
// first part of a source may be a link itself and is followed. Throws Failure for what cannot be
// read.
std::vector<std::string> FindLinks(const std::vector<std::string>& sources);

// A temporary folder with copies of links at their places, and nothing else in it but the folders
// on the way: what 7z needs to see to store them as links.
class LinkMirror {
 public:
  explicit LinkMirror(const std::vector<std::string>& links);
  ~LinkMirror();
  LinkMirror(const LinkMirror&) = delete;
  LinkMirror& operator=(const LinkMirror&) = delete;

  const std::string& Path() const { return path_; }

 private:
  std::string path_;
};

}  // namespace Archiver
