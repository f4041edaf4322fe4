#include "device/host/request_queue.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace Device {

struct RequestQueue::Limits {
  std::size_t of_one;
  std::size_t of_all;
  std::size_t reserve;  // of these, for clients that have none
};

bool RequestQueue::HasRoom(const std::string& client, std::size_t Counts::*kind,
                           const Limits& limits) const {
  const auto found = counts_.find(client);
  const std::size_t has = found == counts_.end() ? 0 : found->second.*kind;
  return has < limits.of_one &&
         all_.*kind < (has == 0 ? limits.of_all : limits.of_all - limits.reserve);
}

bool RequestQueue::MayRun(const Asker& asker) const {
  constexpr Limits kRunning = {8, 128, 16};
  constexpr Limits kStreams = {16, 256, 32};
  return asker.is_stream ? HasRoom(asker.client, &Counts::streams, kStreams)
                         : HasRoom(asker.client, &Counts::running, kRunning);
}

void RequestQueue::Count(const std::string& client, std::size_t Counts::*kind, int change) {
  Counts& counts = counts_[client];
  counts.*kind += static_cast<std::size_t>(change);
  all_.*kind += static_cast<std::size_t>(change);
  if (counts.running + counts.streams + counts.waiting == 0) {
    counts_.erase(client);
  }
}

bool RequestQueue::Add(const Asker& asker, Start start) {
  constexpr Limits kWaiting = {128, 768, 128};
  if (asker.is_stream ? !MayRun(asker) : !HasRoom(asker.client, &Counts::waiting, kWaiting)) {
    return false;
  }
  waiting_.push_back({asker, std::move(start)});
  Count(asker.client, &Counts::waiting, 1);
  StartThoseWhoMay();
  return true;
}

void RequestQueue::StartThoseWhoMay() {
  for (auto each = waiting_.begin(); each != waiting_.end();) {
    const auto next = std::next(each);
    if (MayRun(each->asker)) {
      const Waiting taken = std::move(*each);  // out of what its process forgets
      waiting_.erase(each);
      Count(taken.asker.client, &Counts::waiting, -1);
      if (const pid_t pid = taken.start(); pid > 0) {
        Count(taken.asker.client, taken.asker.is_stream ? &Counts::streams : &Counts::running, 1);
        running_.emplace(pid, taken.asker);
      }
    }
    each = next;
  }
}

void RequestQueue::TakeEnd(pid_t pid) {
  if (const auto found = running_.find(pid); found != running_.end()) {
    const Asker asker = std::move(found->second);
    running_.erase(found);
    Count(asker.client, asker.is_stream ? &Counts::streams : &Counts::running, -1);
    StartThoseWhoMay();
  }
}

bool RequestQueue::HasStream(const std::string& session) const {
  return std::any_of(running_.begin(), running_.end(), [&](const auto& each) {
    return each.second.is_stream && each.second.session == session;
  });
}

void RequestQueue::Clear() {
  running_.clear();
  waiting_.clear();
}

}  // namespace Device
