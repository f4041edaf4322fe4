#include "device/web/connection_threads.h"

#include <chrono>
#include <system_error>
#include <thread>
#include <utility>

namespace Web {

namespace {

constexpr std::size_t kMostThreads = 4096;
constexpr std::chrono::seconds kIdleKept(10);

}  // namespace

void ConnectionThreads::enqueue(std::function<void()> connection) {
  const std::lock_guard<std::mutex> lock(mutex_);
  connections_.push_back(std::move(connection));
  if (connections_.size() <= idle_ || threads_ >= kMostThreads) {
    is_waiting_.notify_one();
    return;
  }
  try {
    std::thread([this] { Work(); }).detach();
    ++threads_;
  } catch (const std::system_error&) {
    // The connection waits for a thread that there is.
  }
}

void ConnectionThreads::Work() {
  std::unique_lock<std::mutex> lock(mutex_);
  for (;;) {
    ++idle_;
    const bool has_work =
        is_waiting_.wait_for(lock, kIdleKept, [this] { return !connections_.empty(); });
    --idle_;
    if (!has_work) {
      --threads_;
      return;
    }
    const std::function<void()> connection = std::move(connections_.front());
    connections_.pop_front();
    lock.unlock();
    connection();
    lock.lock();
  }
}

}  // namespace Web
