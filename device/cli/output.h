// What the commands print: results on standard output, all else on standard error.
#pragma once

#include <json/json.h>

#include <cstddef>
#include <stdexcept>
#include <string>

namespace Device {

// Something that was asked for and does not work: exit status 1.
struct Failure : std::runtime_error {
  using std::runtime_error::runtime_error;
};

// From now on std::cout writes when it is flushed, and the reason of its first failure is kept for
// FinishOutput.
void WatchOutput();

// To be called at the end: flushes std::cout, and is true when all that was printed is written.
// When it is not, prints the reason; but when the reader has gone, ends the process by SIGPIPE.
bool FinishOutput();

// The text's last bytes, so many at most, with "?" for control characters. On a terminal they take
// no more columns than there are bytes.
std::string Printable(const std::string& text, std::size_t most_bytes = std::string::npos);
// A name as it goes to standard output: printable on a terminal.
std::string Shown(const std::string& name);

// A task's state in words: "waiting, 3 jobs before it".
std::string StateText(const Json::Value& task);

// "kavo-device: REASON" on standard error.
void PrintError(const std::string& reason);
// A line in UTF-8 on standard output.
void PrintJson(const Json::Value& value);

}  // namespace Device
