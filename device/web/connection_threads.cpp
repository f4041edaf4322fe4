#include "device/web/connection_threads.h"

#include <system_error>
#include <thread>

namespace Web {

void ConnectionThreads::enqueue(std::function<void()> connection) {
  constexpr int kMostThreads = 4096;
  std::unique_lock<std::mutex> lock(mutex_);
  has_room_.wait(lock, [this] { return threads_ < kMostThreads; });
  const auto serve = [this, connection] {
    connection();
    const std::lock_guard<std::mutex> ended(mutex_);
    --threads_;
    has_room_.notify_one();
  };
  ++threads_;
  lock.unlock();
  try {
    std::thread(serve).detach();
  } catch (const std::system_error&) {
    serve();  // there is no thread to be had: others wait meanwhile
  }
}

}  // namespace Web
