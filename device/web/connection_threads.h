// A thread for each connection, so that slow clients hold up nobody else.
#pragma once

#include <httplib.h>

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>

namespace Web {

// The threads end with the process.
class ConnectionThreads : public httplib::TaskQueue {
 public:
  void enqueue(std::function<void()> connection) override;
  void shutdown() override {}

 private:
  void Work();

  std::mutex mutex_;
  std::condition_variable is_waiting_;
  std::deque<std::function<void()>> connections_;
  std::size_t threads_ = 0;
  std::size_t idle_ = 0;
};

}  // namespace Web
