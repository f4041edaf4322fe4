#ifndef DEVICE_ARCHIVER_UNIQUE_FD_H_
#define DEVICE_ARCHIVER_UNIQUE_FD_H_

#include <unistd.h>

#include <utility>

namespace Archiver {

class UniqueFd {
 public:
  explicit UniqueFd(int fd = -1) : fd_(fd) {}
  UniqueFd(UniqueFd&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
  }
  UniqueFd(const UniqueFd&) = delete;
  UniqueFd& operator=(const UniqueFd&) = delete;
  ~UniqueFd() { Close(); }

  void Close() {
    if (fd_ >= 0) {
      close(std::exchange(fd_, -1));
    }
  }
  int Get() const { return fd_; }
  bool Valid() const { return fd_ >= 0; }

 private:
  int fd_;
};

}  // namespace Archiver

#endif  // DEVICE_ARCHIVER_UNIQUE_FD_H_
