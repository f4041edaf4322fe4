#include "bench/turns.h"

#include <poll.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <csignal>
#include <stdexcept>
#include <vector>

#include "device/base/file_descriptor.h"

namespace Bench {

namespace {

using std::chrono::milliseconds;

constexpr milliseconds kTurn(100);
constexpr double kFirstAsk = 1;  // seconds
constexpr double kHalf = 0.5;
constexpr double kQuarter = 0.25;

double Quantile(std::vector<double> values, double part) {
  std::sort(values.begin(), values.end());
  return values[static_cast<std::size_t>(part * static_cast<double>(values.size()))];
}

Range MiddleHalf(const std::vector<double>& values) {
  return {Quantile(values, kQuarter), Quantile(values, 1 - kQuarter)};
}

struct Samples {
  void Add(double our, double their, double their_repeat) {
    ours.push_back(our);
    theirs.push_back(their);
    ratios.push_back(our / their);
    repeats.push_back(their_repeat);
  }

  Medians Summary() const {
    return {Quantile(ours, kHalf), Quantile(theirs, kHalf), Quantile(ratios, kHalf),
            MiddleHalf(ratios), MiddleHalf(repeats)};
  }

  std::vector<double> ours;
  std::vector<double> theirs;  // what each of ours is compared with
  std::vector<double> ratios;
  std::vector<double> repeats;  // theirs to theirs
};

// A side at work. It moves on only in its turns.
class Run {
 public:
  explicit Run(const Side& side) : side_(side) {
    seconds_ = Seconds([&] {
      leader_ = side_.start();
      leader_end_ = Device::FileDescriptor(static_cast<int>(syscall(SYS_pidfd_open, leader_, 0)));
    });
    Require(static_cast<bool>(leader_end_), "pidfd_open");
    Hold();
  }

  Run(const Run&) = delete;
  Run& operator=(const Run&) = delete;

  ~Run() {
    if (!is_over_) {
      kill(-leader_, SIGKILL);
      waitpid(leader_, nullptr, 0);
    }
  }

  void MoveOn(milliseconds turn) {
    seconds_ += Seconds([&] {
      kill(-leader_, SIGCONT);
      pollfd end = {leader_end_.Get(), POLLIN, 0};
      if (poll(&end, 1, static_cast<int>(turn.count())) == 1) {
        int status = 0;
        Require(waitpid(leader_, &status, 0) == leader_, "waitpid");
        is_over_ = true;
        side_.finish(status);
      } else if (side_.ask && seconds_ >= next_ask_) {
        // It goes on working meanwhile, and may hold what the answer needs.
        next_ask_ = seconds_ + std::chrono::duration<double>(side_.ask()).count();
      }
    });
    if (!is_over_) {
      Hold();
    }
  }

  bool IsOver() const { return is_over_; }
  double Took() const { return seconds_; }

 private:
  void Hold() const { kill(-leader_, SIGSTOP); }

  const Side& side_;
  pid_t leader_ = -1;
  Device::FileDescriptor leader_end_;
  bool is_over_ = false;
  double seconds_ = 0;
  double next_ask_ = kFirstAsk;
};

}  // namespace

Medians Compare(const std::function<double()>& ours, const std::function<double()>& theirs,
                std::size_t pairs) {
  ours();
  double before = theirs();
  Samples samples;
  for (std::size_t pair = 0; pair < pairs; ++pair) {
    const double our = ours();
    const double after = theirs();
    samples.Add(our, kHalf * (before + after), after / before);
    before = after;
  }
  return samples.Summary();
}

Medians CompareSideBySide(const Side& ours, const Side& theirs, const Side& theirs_again,
                          std::size_t rounds) {
  Samples samples;
  for (std::size_t round = 0; round < rounds; ++round) {
    for (const Side* side : {&ours, &theirs, &theirs_again}) {
      side->prepare();
    }
    sync();  // what the round before has written is not written back during this one
    std::array<Run, 3> runs = {Run(ours), Run(theirs), Run(theirs_again)};
    // Who follows whom differs from round to round, for the one before leaves its traces in the
    // caches.
    std::array<Run*, 3> order = {&runs[0], &runs[1], &runs[2]};
    if (round % 2 == 1) {
      std::reverse(order.begin(), order.end());
    }
    while (!std::all_of(runs.begin(), runs.end(), [](const Run& run) { return run.IsOver(); })) {
      for (Run* run : order) {
        if (!run->IsOver()) {
          run->MoveOn(kTurn);
        }
      }
    }
    samples.Add(runs[0].Took(), kHalf * (runs[1].Took() + runs[2].Took()),
                runs[2].Took() / runs[1].Took());
  }
  return samples.Summary();
}

double RunAlone(const Side& side) {
  side.prepare();
  sync();  // what the run before has written is not written back during this one
  Run run(side);
  while (!run.IsOver()) {
    run.MoveOn(kTurn);
  }
  return run.Took();
}

double Seconds(const std::function<void()>& body) {
  const auto begin = std::chrono::steady_clock::now();
  body();
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - begin).count();
}

void Require(bool holds, const std::string& what) {
  if (!holds) {
    throw std::runtime_error(what);
  }
}

}  // namespace Bench
