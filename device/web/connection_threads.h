// A thread for each connection, so that slow clients hold up nobody else.
#pragma once

#include <httplib.h>

#include <condition_variable>
#include <functional>
#include <mutex>

namespace Web {

// Further connections wait to be accepted. The threads end with the process.
class ConnectionThreads : public httplib::TaskQueue {
 public:
  void enqueue(std::function<void()> connection) override;
  void shutdown() override {}

 private:
  std::mutex mutex_;
  std::condition_variable has_room_;
  int threads_ = 0;
};

}  // namespace Web
