#pragma once

#include <exception>
#include <stdexcept>
#include <string>

namespace Archiver {

// The job cannot be done; what() is the one line that the caller gets to read.
class Failure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// The job was told to stop, or nobody reads its report any more.
class Cancelled : public std::exception {
 public:
  const char* what() const noexcept override { return "cancelled"; }
};

// "OPERATION 'OBJECT': text of the errno value".
Failure SystemFailure(const std::string& operation, const std::string& object, int error);

// "OPERATION 'OBJECT': REASON".
Failure NamedFailure(const std::string& operation, const std::string& object,
                     const std::string& reason);

// `text` with control characters replaced, so that it cannot break a line or drive a terminal.
std::string Printable(const std::string& text);

// `name` fit for an error line: printable, and never readable as the mark or the cause of a failure
// by a caller that looks for these texts anywhere in the line.
std::string NameInError(const std::string& name);

}  // namespace Archiver
