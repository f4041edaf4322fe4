#pragma once

#include <sys/types.h>

#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

namespace Archiver {

// What bears a name: the file's or folder's device and inode.
using Identities = std::unordered_map<std::string, std::pair<dev_t, ino_t>>;

// The sources that a list of "./name" lines names, relative to the working directory, each once and
// without the leading "./". Throws Failure for a line that leads out of the working directory, and
// for a list that names nothing. `list_path` serves messages only.
std::vector<std::string> ReadSources(const std::string& text, const std::string& list_path);

// Drops sources that lie in others, for 7z refuses to meet a file twice. `folders` are those of the
// sources that others can lie in.
std::vector<std::string> WithoutNested(std::vector<std::string> sources, const Identities& folders);

// Names as 7z takes them literally under -spd.
struct NamesFor7z {
  bool IsEmpty() const { return list.empty() && arguments.empty(); }

  std::string list;                    // text of a list file
  std::vector<std::string> arguments;  // names that no list line can hold, for the command line
};

// A list line is UTF-8, ends at a carriage return and loses outer blanks unless quoted.
NamesFor7z DivideNames(const std::vector<std::string>& names);

}  // namespace Archiver
