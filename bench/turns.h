// Compares two ways to do the same work, run by turns.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <functional>

#include "bench/table.h"

namespace Bench {

// Work done by processes of a group of their own.
struct Side {
  std::function<void()> prepare;  // not counted
  // The first process: a child of this one, which leads the group, and whose end is the work's.
  std::function<pid_t()> start;
  // Called now and then while it works; the time until the next call. May be empty.
  std::function<std::chrono::milliseconds()> ask;
  // Called at its end, with the first process's status from waitpid(). Throws when it failed.
  std::function<void(int)> finish;
};

// Runs both sides one after the other, A B A B, after a first run of each that does not count. Each
// side returns the seconds it took. Each of ours is compared with the mean of theirs before and
// after it, so that what slows the machine for a while counts on both sides.
Medians Compare(const std::function<double()>& ours, const std::function<double()>& theirs,
                std::size_t pairs);

// For work of a second or more, in the course of which the machine's own speed changes: runs ours,
// theirs and theirs once more side by side, each held still while another moves on, by turns of a
// small part of a second. Only the time in which a side moved on counts; clocks and the kernel's
// own writing go on while a side is held, so that a wait for a timer shows only in part: compare
// short work, too, whose sides run alone. Ours is compared with the mean of theirs; how far the two
// of theirs differ is the noise.
Medians CompareSideBySide(const Side& ours, const Side& theirs, const Side& theirs_again,
                          std::size_t rounds);

// The seconds that the side takes when it runs alone.
double RunAlone(const Side& side);
double Seconds(const std::function<void()>& body);

// Throws std::runtime_error that says what does not hold.
void Require(bool holds, const std::string& what);

}  // namespace Bench
