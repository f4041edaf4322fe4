#include "device/archiver/report.h"

#include <poll.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <csignal>
#include <string_view>

#include "device/archiver/failure.h"

namespace Archiver {

Report::Report(int fd) : fd_(fd) {
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

void Report::CheckCancelled() const {
  pollfd watched[] = {{SignalFd(), POLLIN, 0}, {fd_, 0, 0}};
  poll(watched, 2, 0);
  if ((watched[0].revents & POLLIN) != 0 || (watched[1].revents & POLLERR) != 0) {
    throw Cancelled();
  }
}

void Report::Total(uint64_t bytes) {
  if (!has_total_) {
    has_total_ = true;
    Line("Total: " + std::to_string(bytes));
  }
}

void Report::Compressing(const std::string& name) {
  if (name != name_) {
    name_ = name;
    Line("Compressing " + Printable(name));
  }
}

void Report::Progress(uint64_t percent) {
  Percent(static_cast<int>(std::min<uint64_t>(percent, 99)));
}

void Report::Done() { Percent(100); }

void Report::Error(const std::string& reason) { Line("Error: " + Printable(reason)); }

void Report::Note(const std::string& text) { Line("Note: " + Printable(text)); }

void Report::CancelledRun() {
  // On a line of its own, as the one before may be cut off.
  constexpr std::string_view kText = "\nError: cancelled\n";
  pollfd reader = {fd_, POLLOUT, 0};
  if (poll(&reader, 1, 0) == 1 && (reader.revents & POLLERR) == 0) {
    (void)!write(fd_, kText.data(), kText.size());
  }
}

void Report::Percent(int percent) {
  if (percent > percent_) {
    percent_ = percent;
    Line("Progress: " + std::to_string(percent));
  }
}

void Report::Line(const std::string& text) {
  const std::string line = text + '\n';
  for (size_t done = 0; done < line.size();) {
    pollfd watched[] = {{fd_, POLLOUT, 0}, {SignalFd(), POLLIN, 0}};
    if (poll(watched, 2, -1) < 0 && errno == EINTR) {
      continue;
    }
    CheckCancelled();
    // A pipe that polls writable takes PIPE_BUF bytes without blocking, and promises no more.
    const ssize_t written =
        write(fd_, line.data() + done, std::min<size_t>(line.size() - done, PIPE_BUF));
    if (written > 0) {
      done += static_cast<size_t>(written);
    } else if (written < 0 && errno != EINTR && errno != EAGAIN) {
      throw Cancelled();
    }
  }
}

}  // namespace Archiver
