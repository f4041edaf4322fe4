#include "device/archiver/command_line.h"

#include <algorithm>

#include "device/archiver/failure.h"

namespace Archiver {
namespace {

constexpr char kProgress[] = "-progress";
constexpr char kAdd[] = "a";

bool StartsWith(const std::string& text, const char* prefix) { return text.rfind(prefix, 0) == 0; }

// "-progress" is the last argument; anywhere else it is the password "rogress".
bool IsPassword(const std::string& argument, bool last) {
  return StartsWith(argument, "-p") && !(last && argument == kProgress);
}

void ParseSwitch(const std::string& argument, bool last, Request* request) {
  if (IsPassword(argument, last)) {
    request->password = argument.substr(2);
  } else if (StartsWith(argument, "-lang")) {
    request->zip = true;
    request->code_page = argument.substr(5);
  } else if (StartsWith(argument, "-xr!") && argument.size() > 4) {
    request->exclude.push_back(argument.substr(4));
  } else if (StartsWith(argument, "-u") && argument.size() > 2 &&
             argument.find_first_not_of("pqrxyzw0123", 2) == std::string::npos) {
    request->actions = argument.substr(2);
  } else if (argument.size() == 4 && StartsWith(argument, "-mx") && argument[3] >= '0' &&
             argument[3] <= '9') {
    request->level = argument;
  } else if (argument != "-utf16" && argument != kProgress) {
    throw Failure("unknown switch '" + NameInError(argument) + "'");
  }
}

}  // namespace

Request ParseCommandLine(const std::vector<std::string>& arguments) {
  Request request;
  if (arguments.empty()) {
    throw Failure("no command");
  }
  request.command = arguments[0].empty() ? kAdd : arguments[0];
  if (request.command == kAdd) {
    request.actions = "p1q1r2x2y2z2w2";
  } else if (request.command == "u") {
    request.actions = "p1q1r2x1y2z1w2";
  } else {
    throw Failure("unknown command '" + NameInError(request.command) + "'");
  }
  for (size_t i = 1; i < arguments.size(); ++i) {
    const std::string& argument = arguments[i];
    if (argument.empty()) {
      continue;
    }
    if (argument[0] == '-') {
      ParseSwitch(argument, i + 1 == arguments.size(), &request);
    } else if (argument[0] == '@' && request.list_path.empty()) {
      request.list_path = argument.substr(1);
    } else if (argument[0] == '/' && argument.back() != '/' && request.archive.empty()) {
      request.archive = argument;
    } else {
      throw Failure("unexpected argument '" + NameInError(argument) + "'");
    }
  }
  if (request.archive.empty() || request.list_path.empty()) {
    throw Failure(request.archive.empty() ? "no archive named" : "no list of files named");
  }
  return request;
}

void CheckPassword(const Request& request) {
  const std::string& password = request.password;
  if (password.find('\n') != std::string::npos) {
    throw Failure("the password holds a line break");
  }
  const bool plain =
      std::all_of(password.begin(), password.end(), [](char c) { return c >= ' ' && c <= '~'; });
  if (request.zip && !plain) {
    throw Failure("the password of a zip archive can hold printable ASCII characters only");
  }
}

}  // namespace Archiver
