// How many event streams each session has open.
#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>

namespace Web {

class StreamCount {
 public:
  // Counts one more for as long as the result lives; null when there are too many.
  std::shared_ptr<void> Open(const std::string& session);
  bool HasAny(const std::string& session);

 private:
  void Close(const std::string& session);

  std::mutex mutex_;
  std::map<std::string, std::size_t> counts_;
  std::size_t total_ = 0;
};

}  // namespace Web
