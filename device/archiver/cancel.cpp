#include "device/archiver/cancel.h"

#include <poll.h>
#include <sys/signalfd.h>

#include <cerrno>
#include <csignal>

#include "device/archiver/failure.h"

namespace Archiver {

Cancel::Cancel(int report_fd) : report_fd_(report_fd) {
  signal(SIGPIPE, SIG_IGN);
  sigset_t stops;
  sigemptyset(&stops);
  for (const int number : {SIGTERM, SIGINT, SIGHUP}) {
    sigaddset(&stops, number);
  }
  sigprocmask(SIG_BLOCK, &stops, nullptr);
  signals_ = Device::FileDescriptor(signalfd(-1, &stops, SFD_CLOEXEC | SFD_NONBLOCK));
  if (!signals_) {
    throw SystemFailure("cannot watch", "signals", errno);
  }
}

void Cancel::Check() const {
  pollfd watched[] = {{signals_.Get(), POLLIN, 0}, {report_fd_, 0, 0}};
  poll(watched, 2, 0);
  if ((watched[0].revents & POLLIN) != 0 || (watched[1].revents & POLLERR) != 0) {
    throw Cancelled();
  }
}

}  // namespace Archiver
