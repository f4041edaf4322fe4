#include "device/cli/output.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <iostream>
#include <sstream>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/base/utf8.h"

namespace Device {

namespace {

struct Output : std::stringbuf {
  // Once it has failed, std::cout does not get here again.
  int sync() override {
    error = WriteAll(STDOUT_FILENO, str()) ? 0 : errno;
    str("");
    return error == 0 ? 0 : -1;
  }
  int error = 0;
};

// What a terminal obeys, and what turns the direction of what comes after.
bool IsControl(const std::string& character) {
  return (character.size() == 1 && (character[0] < ' ' || character[0] == '\x7F')) ||
         (character >= "\xC2\x80" && character < "\xC2\xA0") ||
         (character >= "\xE2\x80\xAA" && character <= "\xE2\x80\xAE") ||
         (character >= "\xE2\x81\xA6" && character <= "\xE2\x81\xA9");
}

Output& TheOutput() {
  static auto& output = *new Output;  // std::cout has it to the very end
  return output;
}

}  // namespace

void WatchOutput() { std::cout.rdbuf(&TheOutput()); }

bool FinishOutput() {
  if (std::cout.flush()) {
    return true;
  }
  if (TheOutput().error == EPIPE) {
    std::signal(SIGPIPE, SIG_DFL);
    std::raise(SIGPIPE);
  }
  PrintError(std::string("standard output: ") + std::strerror(TheOutput().error));
  return false;
}

std::string Printable(const std::string& text, std::size_t most_bytes) {
  std::string kept = text.substr(text.size() - std::min(text.size(), most_bytes));
  while (kept.size() < text.size() && !kept.empty() && (kept[0] & 0xC0) == 0x80) {
    kept.erase(0, 1);  // of a character that was cut
  }
  std::string printable;
  for (std::size_t at = 0, length = 0; at < kept.size(); at += std::max<std::size_t>(length, 1)) {
    length = Utf8SequenceLength(kept, at);
    const std::string character = kept.substr(at, length);
    printable += length == 0 || IsControl(character) ? "?" : character;
  }
  return printable;
}

std::string Shown(const std::string& name) {
  return isatty(STDOUT_FILENO) != 0 ? Printable(name) : name;
}

std::string StateText(const Json::Value& task) {
  const std::string before = task["before"].asString();
  return task["state"].asString() +
         (before.empty() ? "" : ", " + before + (before == "1" ? " job" : " jobs") + " before it");
}

void PrintError(const std::string& reason) {
  std::cerr << "kavo-device: " << Printable(reason) << '\n';
}

void PrintJson(const Json::Value& value) { std::cout << ToUtf8Text(value) << '\n'; }

}  // namespace Device
