// kavo-zip: see zip_program.h.

#include <unistd.h>

#include <exception>
#include <iostream>
#include <iterator>
#include <string>
#include <vector>

#include "device/archiver/failure.h"
#include "device/archiver/zip_entries.h"
#include "device/archiver/zip_program.h"
#include "device/base/code_page.h"

namespace {

int Run(const std::string& command, const std::string& archive, const std::string& page_name) {
  const auto page =
      Device::CodePage::IsUtf8(page_name) ? nullptr : Device::CodePage::Open(page_name);
  if (command == Archiver::kZipCheck) {
    const std::string password(std::istreambuf_iterator<char>(std::cin), {});
    Archiver::CheckMembers(archive, password);
    return page && Archiver::HasNamesIn(*page, archive) ? Archiver::kZipNo : Archiver::kZipYes;
  }
  if (command == Archiver::kZipToUtf8 && page) {
    Archiver::NamesToUtf8(*page, archive);
    return Archiver::kZipYes;
  }
  if (command == Archiver::kZipToCodePage && page) {
    Archiver::NamesToCodePage(*page, archive);
    return Archiver::kZipYes;
  }
  throw Archiver::Failure("unknown command '" + command + "'");
}

}  // namespace

int main(int argc, char** argv) {
  const std::vector<std::string> arguments(argv, argv + argc);
  constexpr std::size_t kArguments = 4;
  try {
    if (arguments.size() != kArguments) {
      throw Archiver::Failure("usage: kavo-zip COMMAND ARCHIVE CODE-PAGE");
    }
    return Run(arguments[1], arguments[2], arguments[3]);
  } catch (const std::exception& error) {
    std::cerr << error.what();
    return Archiver::kZipFailed;
  }
}
