// Who is signed in. The sessions live in the launcher; processes forked from it see those that were
// there, and the end of each.
#pragma once

#include <chrono>
#include <cstddef>
#include <map>
#include <string>
#include <utility>

namespace Device {

// Makes a session for the user, as signing in does, and returns its id, which cannot be guessed. A
// user's oldest sessions end when there are too many. Throws std::system_error.
std::string SignIn(const std::string& user);

// Ends the session, also for processes that were forked before: they see it the next time they ask.
// Any text may be given.
void SignOut(const std::string& session_id);

// From now on the sessions are for this process as they were, whoever ends them: a job that waits
// for its turn goes on when its user has signed out.
void KeepSessions();

// The user of a session that has not ended; empty when there is none.
std::string UserOfSession(const std::string& session_id);

// True if the password is the user's. Takes as long for a user that is not there.
bool IsPassword(const std::string& user, const std::string& password);

// Slows down who tries passwords: after ten wrong ones in a row the sign-in under that name is open
// to that client again only after a while, which doubles each time; others, the user among them, do
// not notice. It does not know which names there are, and keeps so many counts at the most.
class SignInGate {
 public:
  using Clock = std::chrono::steady_clock;

  // To be called before a password is looked at: 0, or how long to wait before the next try.
  std::chrono::seconds Try(const std::string& user, const std::string& client,
                           Clock::time_point now);
  void Succeeded(const std::string& user, const std::string& client) {
    tries_.erase(Counted(user, client));
  }

 private:
  struct Tries {
    int count = 0;
    Clock::time_point open_again;
  };
  using Pair = std::pair<std::string, std::string>;  // the client and the name
  static Pair Counted(const std::string& user, const std::string& client);

  std::map<Pair, Tries> tries_;
};

}  // namespace Device
