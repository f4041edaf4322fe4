// Connections: a thread for each, so that slow clients hold up nobody else, and a deadline for what
// a client sends or takes, so that none holds one for ever.
#pragma once

#include <httplib.h>

#include <array>
#include <chrono>
#include <functional>
#include <string>

namespace Web {

class Connection : public httplib::Stream {
 public:
  // Takes the socket. Waits for the head of a request from then on.
  explicit Connection(int socket);
  ~Connection() override;
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;

  // The one that this thread serves.
  static Connection& OfThisThread();

  // A name for where the client is: its address, in IPv6 its network's.
  const std::string& Client() const { return client_; }

  // From now on a body is read, of a signed-in user or not. Those that are being read, heads among
  // them, make room for others, the oldest first: when there are too many of one client's without
  // a session, or there is no thread for a new one.
  void BeginBody(bool is_users);
  // A part of the body has come. Without that only so much is read as a head may have: the library
  // keeps a line of any length.
  void NotePart() { allowed_ = kMostHeadBytes; }
  // Nothing more is read, and the connection is not to be closed for another's sake.
  void EndReading();
  // What is written from now on has so much time.
  void AllowForWriting(std::chrono::seconds time) { deadline_ = Clock::now() + time; }
  bool IsLate() const { return Clock::now() >= deadline_; }

  bool is_readable() const override;  // a part of the body
  bool is_writable() const override;
  ssize_t read(char* to, std::size_t size) override;
  using Stream::write;
  ssize_t write(const char* from, std::size_t size) override;
  void get_remote_ip_and_port(std::string& ip, int& /*port*/) const override { ip = client_; }
  void get_local_ip_and_port(std::string& ip, int& port) const override;
  socket_t socket() const override { return socket_; }

 private:
  using Clock = std::chrono::steady_clock;
  static constexpr std::size_t kMostHeadBytes = std::size_t{32} << 10U;
  static constexpr int kMostHeadLines = 100;  // the library keeps each in a place of its own

  void BeginReading(const std::string& counted_for, std::chrono::seconds time);
  // As the library reads a head, byte by byte. It decodes what stands in fields, as if clients
  // encoded it, and would find another cookie in the text of one: so that is encoded here.
  ssize_t ReadOfHead(char* to);
  // False at the deadline.
  bool WaitFor(short event) const;

  int socket_;
  std::string client_;
  Clock::time_point deadline_;
  std::array<char, 4096> buffer_;  // what was received
  std::size_t begin_ = 0;          // and not read yet
  std::size_t end_ = 0;
  std::size_t allowed_ = kMostHeadBytes;
  bool is_head_ = true;
  int head_lines_ = 0;
  std::string encoded_;  // what is left of a byte of the head
};

// The numeric address, and the port, at this machine's end.
std::string OwnAddress(int socket, int& port);

class ConnectionThreads : public httplib::TaskQueue {
 public:
  void enqueue(std::function<void()> connection) override;
  void shutdown() override {}  // they end with the process
};

}  // namespace Web
