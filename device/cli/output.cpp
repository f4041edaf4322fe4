#include "device/cli/output.h"

#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <iostream>
#include <sstream>

#include "device/base/file_io.h"

namespace Device {

namespace {

class Output : public std::stringbuf {
 public:
  Output() : std::stringbuf(std::ios::out), replaced_(std::cout.rdbuf(this)) {}
  ~Output() override { std::cout.rdbuf(replaced_); }

  int Error() const { return error_; }

 protected:
  // Once it has failed, std::cout does not get here again.
  int sync() override {
    error_ = WriteAll(STDOUT_FILENO, str()) ? 0 : errno;
    str("");
    return error_ == 0 ? 0 : -1;
  }

 private:
  std::streambuf* const replaced_;
  int error_ = 0;
};

Output& TheOutput() {
  static Output output;
  return output;
}

}  // namespace

void WatchOutput() { TheOutput(); }

bool FinishOutput() {
  if (std::cout.flush()) {
    return true;
  }
  if (TheOutput().Error() == EPIPE) {
    std::signal(SIGPIPE, SIG_DFL);
    std::raise(SIGPIPE);
  }
  std::cerr << "kavo-device: standard output: " << std::strerror(TheOutput().Error()) << '\n';
  return false;
}

}  // namespace Device
