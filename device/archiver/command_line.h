#pragma once

#include <string>
#include <vector>

namespace Archiver {

struct Request {
  std::string command;               // "a" or "u"
  std::string archive;               // absolute path
  std::string actions;               // "p1q1r2x2y2z2w2": what becomes of old and new entries
  std::string level;                 // "-mx6", or empty for the default
  bool zip = false;                  // otherwise 7z
  std::string code_page;             // of the names in a zip; empty for UTF-8
  std::string password;              // empty for none
  std::vector<std::string> exclude;  // names left out at any depth
  std::string list_path;
};

// Reads the arguments after the program's name. An empty command means "a", other empty arguments
// stand for absent switches. Throws Failure for a vector that no caller of this program should
// send.
Request ParseCommandLine(const std::vector<std::string>& arguments);

// Throws Failure for a password which 7z cannot take for this request.
void CheckPassword(const Request& request);

}  // namespace Archiver
