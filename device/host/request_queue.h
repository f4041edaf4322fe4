// Which of the requests that have come run, which wait for their turn, and which are too many, so
// that one client's do not hold up another's.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <functional>
#include <list>
#include <map>
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
  void Clear();

 private:
  struct Counts {
    std::size_t running = 0;
    std::size_t streams = 0;
    std::size_t waiting = 0;
  };
  struct Limits;
  struct Waiting {
    Asker asker;
    Start start;
  };

  bool HasRoom(const std::string& client, std::size_t Counts::*kind, const Limits& limits) const;
  bool MayRun(const Asker& asker) const;
  void Count(const std::string& client, std::size_t Counts::*kind, int change);
  void StartThoseWhoMay();

  std::map<std::string, Counts> counts_;  // by client
  Counts all_;
  std::map<pid_t, Asker> running_;
  std::list<Waiting> waiting_;
};

}  // namespace Device
