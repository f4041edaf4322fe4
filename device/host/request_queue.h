// Which of the requests that have come run, which wait for their turn, and which are too many, so
// that one client's do not hold up another's.
#pragma once

#include <sys/types.h>

#include <functional>
#include <list>
#include <string>

namespace Device {

struct Asker {
  std::string client;  // a user, or the address of one who is not signed in
  std::string session;
  bool is_stream = false;  // of events: it takes little, and stays
};

class RequestQueue {
 public:
  // Returns the process that serves the request; -1 when there is none.
  using Start = std::function<pid_t()>;

  // Starts the request, now or when its turn comes. False when that client, or all of them, have
  // too many; streams never wait.
  bool Add(const Asker& asker, Start start);
  // To be called when a process has ended, whether or not it was started here.
  void TakeEnd(pid_t pid);
  bool HasStream(const std::string& session) const;
  // Forgets them all, in a child process.
  void Clear() { entries_.clear(); }

 private:
  struct Entry {
    Asker asker;
    Start start;
    pid_t pid = 0;  // 0: waits
  };

  // For one more, which runs or waits.
  bool HasRoom(const Asker& asker, bool is_to_run) const;
  void StartThoseWhoMay();

  std::list<Entry> entries_;  // in the order in which they came
};

}  // namespace Device
