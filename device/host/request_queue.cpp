#include "device/host/request_queue.h"

#include <algorithm>
#include <cstddef>
#include <iterator>
#include <utility>

namespace Device {

bool RequestQueue::HasRoom(const Asker& asker, bool is_to_run) const {
  struct Limits {
    std::size_t of_one;
    std::size_t of_all;
    std::size_t reserve;  // of these, for clients that have none
  };
  constexpr Limits kRunning = {8, 128, 16};
  constexpr Limits kStreams = {16, 256, 32};
  constexpr Limits kWaiting = {128, 768, 128};
  const Limits& limits = asker.is_stream ? kStreams : is_to_run ? kRunning : kWaiting;
  std::size_t all = 0;
  std::size_t of_one = 0;
  for (const Entry& each : entries_) {
    if ((each.pid != 0) == is_to_run && each.asker.is_stream == asker.is_stream) {
      ++all;
      of_one += each.asker.client == asker.client ? 1 : 0;
    }
  }
  return of_one < limits.of_one &&
         all < (of_one == 0 ? limits.of_all : limits.of_all - limits.reserve);
}

bool RequestQueue::Add(const Asker& asker, Start start) {
  if (!HasRoom(asker, asker.is_stream)) {
    return false;
  }
  entries_.push_back({asker, std::move(start)});
  StartThoseWhoMay();
  return true;
}

void RequestQueue::StartThoseWhoMay() {
  for (auto each = entries_.begin(); each != entries_.end();) {
    const auto next = std::next(each);
    if (each->pid == 0 && HasRoom(each->asker, true)) {
      const Start start = std::move(each->start);  // out of what its process forgets
      each->pid = start();
      if (each->pid <= 0) {
        entries_.erase(each);
      }
    }
    each = next;
  }
}

void RequestQueue::TakeEnd(pid_t pid) {
  const auto has_ended = [pid](const Entry& each) { return each.pid == pid; };
  const auto found = std::find_if(entries_.begin(), entries_.end(), has_ended);
  if (found != entries_.end()) {
    entries_.erase(found);
    StartThoseWhoMay();
  }
}

bool RequestQueue::HasStream(const std::string& session) const {
  return std::any_of(entries_.begin(), entries_.end(), [&](const Entry& each) {
    return each.asker.is_stream && each.asker.session == session;
  });
}

}  // namespace Device
