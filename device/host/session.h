// A signed-in user's session.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>

namespace Device {

// Set once, and seen by the processes that were forked before, too.
class SharedFlag {
 public:
  // Throws std::system_error.
  SharedFlag();

  void Set() { flag_->store(true); }
  bool IsSet() const { return flag_->load(); }

 private:
  std::unique_ptr<std::atomic<bool>, void (*)(std::atomic<bool>*)> flag_;
};

struct Session {
  std::string user;
  std::uint64_t number = 0;  // in the order of signing in
  SharedFlag has_ended;
};

}  // namespace Device
