#include "device/web/connection.h"

#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <condition_variable>
#include <cstring>
#include <list>
#include <mutex>
#include <system_error>
#include <thread>

namespace Web {

namespace {

constexpr std::size_t kMostThreads = 4096;
constexpr std::size_t kMostReadOfOne = 1024;
constexpr std::chrono::seconds kHeadTime(15);
constexpr std::chrono::seconds kBodyTime(60);

thread_local Connection* this_threads_connection = nullptr;

// What is being read, and the threads. Those end with the process, so this does not.
struct Connections {
  struct Reading {
    Connection* connection;
    std::string counted_for;  // the client, while no user is known
  };
  std::mutex mutex;
  std::condition_variable changed;
  std::list<Reading> reading;  // the oldest first
  std::size_t threads = 0;
  bool is_one_closing = false;  // to make room

  void CloseOldest(const std::string* counted_for) {
    const auto oldest = std::find_if(reading.begin(), reading.end(), [&](const Reading& each) {
      return counted_for == nullptr || each.counted_for == *counted_for;
    });
    ::shutdown(oldest->connection->socket(), SHUT_RDWR);
    reading.erase(oldest);
  }
};

Connections& All() {
  static auto& connections = *new Connections;
  return connections;
}

sockaddr_storage AddressOf(int socket, int (*get)(int, sockaddr*, socklen_t*)) {
  sockaddr_storage address{};
  socklen_t size = sizeof address;
  get(socket, reinterpret_cast<sockaddr*>(&address), &size);
  return address;
}

std::string NameOf(const sockaddr_storage& address, int& port) {
  char host[NI_MAXHOST] = "";
  char service[NI_MAXSERV] = "0";
  getnameinfo(reinterpret_cast<const sockaddr*>(&address), sizeof address, host, sizeof host,
              service, sizeof service, NI_NUMERICHOST | NI_NUMERICSERV);
  port = std::atoi(service);
  return host;
}

std::string ClientOf(int socket) {
  constexpr std::size_t kNetworkBytes = 8;
  sockaddr_storage address = AddressOf(socket, getpeername);
  auto& six = reinterpret_cast<sockaddr_in6&>(address);
  if (address.ss_family == AF_INET6 && !IN6_IS_ADDR_V4MAPPED(&six.sin6_addr)) {
    std::fill(six.sin6_addr.s6_addr + kNetworkBytes, std::end(six.sin6_addr.s6_addr), 0);
  }
  int port = 0;
  return NameOf(address, port);
}

}  // namespace

std::string OwnAddress(int socket, int& port) {
  return NameOf(AddressOf(socket, getsockname), port);
}

Connection::Connection(int socket) : socket_(socket), client_(ClientOf(socket)) {
  this_threads_connection = this;
  BeginReading(client_, kHeadTime);
}

Connection::~Connection() {
  EndReading();
  this_threads_connection = nullptr;
  ::shutdown(socket_, SHUT_RDWR);
  close(socket_);
}

Connection& Connection::OfThisThread() { return *this_threads_connection; }

void Connection::BeginReading(const std::string& counted_for, std::chrono::seconds time) {
  deadline_ = Clock::now() + time;
  Connections& all = All();
  const std::lock_guard<std::mutex> lock(all.mutex);
  all.reading.remove_if([this](const auto& each) { return each.connection == this; });
  const auto is_theirs = [&](const auto& each) {
    return !counted_for.empty() && each.counted_for == counted_for;
  };
  if (std::count_if(all.reading.begin(), all.reading.end(), is_theirs) >=
      std::ptrdiff_t{kMostReadOfOne}) {
    all.CloseOldest(&counted_for);
  }
  all.reading.push_back({this, counted_for});
  all.changed.notify_all();
}

void Connection::BeginBody(bool is_users) {
  NotePart();
  is_head_ = false;
  BeginReading(is_users ? "" : client_, kBodyTime);
}

void Connection::EndReading() {
  Connections& all = All();
  const std::lock_guard<std::mutex> lock(all.mutex);
  all.reading.remove_if([this](const auto& each) { return each.connection == this; });
}

bool Connection::WaitFor(short event) const {
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline_ - Clock::now());
  pollfd source = {socket_, event, 0};
  return left.count() > 0 &&
         TEMP_FAILURE_RETRY(poll(&source, 1, static_cast<int>(left.count()))) > 0;
}

bool Connection::is_readable() const { return begin_ < end_ || WaitFor(POLLIN); }

bool Connection::is_writable() const {
  pollfd client = {socket_, POLLRDHUP, 0};
  return WaitFor(POLLOUT) && poll(&client, 1, 0) == 0;  // it is still there
}

ssize_t Connection::ReadOfHead(char* to) {
  if (encoded_.empty() && (allowed_ == 0 || head_lines_ == kMostHeadLines)) {
    return 0;
  }
  if (encoded_.empty()) {
    encoded_ = buffer_[begin_++];
    --allowed_;
    head_lines_ += encoded_ == "\n" ? 1 : 0;
    encoded_ += encoded_ == "%" && head_lines_ > 0 ? "25" : "";
  }
  *to = encoded_.front();
  encoded_.erase(0, 1);
  return 1;
}

ssize_t Connection::read(char* to, std::size_t size) {
  if (begin_ == end_ && encoded_.empty()) {
    const ssize_t got =
        WaitFor(POLLIN) ? TEMP_FAILURE_RETRY(recv(socket_, buffer_.data(), buffer_.size(), 0)) : -1;
    if (got <= 0) {
      return got;
    }
    begin_ = 0;
    end_ = static_cast<std::size_t>(got);
  }
  if (is_head_) {
    return ReadOfHead(to);
  }
  const std::size_t taken = std::min({size, end_ - begin_, allowed_});
  std::memcpy(to, buffer_.data() + begin_, taken);
  begin_ += taken;
  allowed_ -= taken;
  return static_cast<ssize_t>(taken);
}

ssize_t Connection::write(const char* from, std::size_t size) {
  return WaitFor(POLLOUT)
             ? TEMP_FAILURE_RETRY(send(socket_, from, size, MSG_NOSIGNAL | MSG_DONTWAIT))
             : -1;
}

void Connection::get_local_ip_and_port(std::string& ip, int& port) const {
  ip = OwnAddress(socket_, port);
}

void ConnectionThreads::enqueue(std::function<void()> connection) {
  Connections& all = All();
  std::unique_lock<std::mutex> lock(all.mutex);
  while (all.threads >= kMostThreads) {
    if (!all.is_one_closing && !all.reading.empty()) {
      all.CloseOldest(nullptr);
      all.is_one_closing = true;
    }
    all.changed.wait(lock);
  }
  const auto serve = [&all, connection] {
    connection();
    const std::lock_guard<std::mutex> ended(all.mutex);
    --all.threads;
    all.is_one_closing = false;
    all.changed.notify_all();
  };
  ++all.threads;
  lock.unlock();
  try {
    std::thread(serve).detach();
  } catch (const std::system_error&) {
    serve();  // there is no thread to be had: others wait meanwhile
  }
}

}  // namespace Web
