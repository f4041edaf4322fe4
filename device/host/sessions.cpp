#include "device/host/sessions.h"

#include <crypt.h>
#include <sys/mman.h>

#include <algorithm>
#include <atomic>
#include <functional>
#include <list>
#include <memory>
#include <new>
#include <vector>

#include "device/base/file_descriptor.h"
#include "device/base/random_id.h"
#include "device/model/device.h"

namespace Device {

namespace {

constexpr int kSessionIdWords = 4;
constexpr int kMostSessions = 16;  // of one user
constexpr int kFreeTries = 10;
constexpr std::chrono::seconds kLongestWait(60);
constexpr char kNobodysHash[] = "$6$nobody$";

using Flag = std::atomic<bool>;
static_assert(Flag::is_always_lock_free, "a lock would be one process's own");

// In memory that is shared with the processes that are forked from now on.
std::shared_ptr<Flag> MakeSharedFlag() {
  void* const memory =
      mmap(nullptr, sizeof(Flag), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  if (memory == MAP_FAILED) {
    ThrowErrno("shared memory");
  }
  return {new (memory) Flag(false), [](Flag* flag) { munmap(flag, sizeof(Flag)); }};
}

struct Session {
  std::string id;
  std::string user;
  std::shared_ptr<Flag> has_ended = MakeSharedFlag();
};

// In the order of signing in.
std::list<Session>& Sessions() {
  static std::list<Session> sessions;
  return sessions;
}

auto Find(const std::string& id) {
  return std::find_if(Sessions().begin(), Sessions().end(),
                      [&](const Session& each) { return each.id == id; });
}

// In place of that of a user who is not there: one that costs what looking at a user's does.
std::string HashFor(const std::string& name) {
  std::vector<std::string> hashes;
  for (const User& user : TheDevice().config.users) {
    if (!user.password.empty()) {
      hashes.push_back(user.password);
    }
  }
  return hashes.empty() ? kNobodysHash : hashes[std::hash<std::string>()(name) % hashes.size()];
}

}  // namespace

std::string SignIn(const std::string& user) {
  auto& sessions = Sessions();
  const auto is_users = [&](const Session& each) { return each.user == user; };
  if (std::count_if(sessions.begin(), sessions.end(), is_users) >= kMostSessions) {
    SignOut(std::find_if(sessions.begin(), sessions.end(), is_users)->id);
  }
  sessions.push_back({RandomId(kSessionIdWords), user});
  return sessions.back().id;
}

void SignOut(const std::string& session_id) {
  if (const auto found = Find(session_id); found != Sessions().end()) {
    found->has_ended->store(true);
    Sessions().erase(found);
  }
}

void KeepSessions() {
  for (Session& session : Sessions()) {
    session.has_ended = std::make_shared<Flag>(session.has_ended->load());
  }
}

std::string UserOfSession(const std::string& session_id) {
  const auto found = Find(session_id);
  return found == Sessions().end() || *found->has_ended ? "" : found->user;
}

bool IsPassword(const std::string& user, const std::string& password) {
  const User* const known = TheDevice().config.FindUser(user);
  const bool has_password = known != nullptr && !known->password.empty();
  const std::string hash = has_password ? known->password : HashFor(user);
  const auto data = std::make_unique<crypt_data>();
  const char* const result = crypt_r(password.c_str(), hash.c_str(), data.get());
  const bool is_whole = password.find('\0') == std::string::npos;  // crypt_r reads no further
  return has_password && is_whole && result != nullptr && hash == result;
}

SignInGate::Pair SignInGate::Counted(const std::string& user, const std::string& client) {
  // Whoever is on this machine has all of its addresses.
  return {client.rfind("127.", 0) == 0 ? "127.0.0.1" : client, user};
}

std::chrono::seconds SignInGate::Try(const std::string& user, const std::string& client,
                                     Clock::time_point now) {
  constexpr std::size_t kMostCounts = std::size_t{1} << 16U;
  if (tries_.size() >= kMostCounts) {
    tries_.clear();
  }
  Tries& tries = tries_[Counted(user, client)];
  if (now < tries.open_again) {
    return std::chrono::ceil<std::chrono::seconds>(tries.open_again - now);
  }
  if (++tries.count >= kFreeTries) {
    constexpr int kMostDoublings = 6;
    const int doublings = std::min(tries.count - kFreeTries, kMostDoublings);
    tries.open_again = now + std::min(kLongestWait, std::chrono::seconds(1 << doublings));
  }
  return {};
}

}  // namespace Device
