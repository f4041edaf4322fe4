#include "device/web/stream_count.h"

namespace Web {

namespace {

constexpr std::size_t kMostOfOne = 8;
constexpr std::size_t kMost = 256;

}  // namespace

std::shared_ptr<void> StreamCount::Open(const std::string& session) {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (total_ >= kMost || counts_[session] >= kMostOfOne) {
    return nullptr;
  }
  ++total_;
  ++counts_[session];
  return {this, [session](StreamCount* count) { count->Close(session); }};
}

bool StreamCount::HasAny(const std::string& session) {
  const std::lock_guard<std::mutex> lock(mutex_);
  return counts_.count(session) != 0;
}

void StreamCount::Close(const std::string& session) {
  const std::lock_guard<std::mutex> lock(mutex_);
  --total_;
  if (--counts_[session] == 0) {
    counts_.erase(session);
  }
}

}  // namespace Web
