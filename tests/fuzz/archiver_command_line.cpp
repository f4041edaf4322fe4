// The archiver's argument vector: arguments separated by zero bytes.
#include "device/archiver/command_line.h"
#include "device/archiver/failure.h"
#include "tests/fuzz/targets.h"

void FuzzArchiverCommandLine(const std::string& input) {
  std::vector<std::string> arguments = SplitAt('\0', input);
  try {
    const Archiver::Request request = Archiver::ParseCommandLine(arguments);
    Require(request.command == "a" || request.command == "u", "the command is one of two");
    Require(
        request.archive.size() > 1 && request.archive[0] == '/' && request.archive.back() != '/',
        "the archive is the full path of a file");
    Require(!request.list_path.empty() && !request.actions.empty(), "there is something to do");
  } catch (const Archiver::Failure& failure) {
    Require(Archiver::NameInError(failure.what()) == failure.what(), "a failure is one plain line");
  }
  std::vector<char*> argv = {nullptr};
  for (std::string& argument : arguments) {
    argv.push_back(argument.data());
  }
  const bool ends_in_progress = arguments.back() == "-progress";
  Archiver::HidePassword(static_cast<int>(argv.size()), argv.data());
  arguments.resize(arguments.size() - (ends_in_progress ? 1 : 0));
  for (const std::string& argument : arguments) {
    Require(argument.rfind("-p", 0) != 0 || argument.find_first_not_of('\0', 2) == argument.npos,
            "no password stays readable");
  }
}
