// kavo-web LISTEN FD SOCKET: the device's HTTP front end. Its standard input is the launcher's
// socket, FD the folder of the page, SOCKET where to listen instead, or -1. Gives up root's rights
// before it serves anybody.
#include <fcntl.h>
#include <grp.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/base/socket_message.h"
#include "device/host/wire.h"
#include "device/web/connection.h"
#include "device/web/front_end.h"

namespace {

constexpr uid_t kNobody = 65534;

void GiveUpRights() {
  if (geteuid() == 0 && (setgroups(0, nullptr) != 0 || setresgid(kNobody, kNobody, kNobody) != 0 ||
                         setresuid(kNobody, kNobody, kNobody) != 0)) {
    Device::ThrowErrno("cannot give up root's rights");
  }
  if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
    Device::ThrowErrno("cannot give up new rights");
  }
}

// Each connection is a descriptor or two.
void AllowManyDescriptors() {
  rlimit limit{};
  getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

// The host, without brackets, and the port.
std::pair<std::string, std::uint16_t> ParseAddress(const std::string& listen) {
  std::uint16_t port = 0;
  const std::size_t colon = std::min(listen.rfind(':'), listen.size());
  const std::string digits = listen.substr(std::min(colon + 1, listen.size()));
  const char* const end = digits.data() + digits.size();
  const auto [at, error] = std::from_chars(digits.data(), end, port);
  if (colon == 0 || at != end || error != std::errc()) {
    throw std::runtime_error("'" + listen + "' is not ADDRESS:PORT");
  }
  std::string host = listen.substr(0, colon);
  if (host.front() == '[' && host.back() == ']') {
    host = host.substr(1, host.size() - 2);
  }
  return {host, port};
}

// Ends the process when the launcher has closed its socket or is gone.
void WaitForTheEnd(Web::FrontEnd& front_end) {
  pollfd launcher = {STDIN_FILENO, POLLHUP, 0};
  while (poll(&launcher, 1, -1) < 0) {
  }
  front_end.End();
  _exit(0);
}

// Of a socket that is bound, as ADDRESS:PORT.
std::string AddressOf(int socket) {
  int port = 0;
  const std::string host = Web::OwnAddress(socket, port);
  return (host.find(':') == std::string::npos ? host : "[" + host + "]") + ":" +
         std::to_string(port);
}

// Binds the port that was asked for, and returns the address.
std::string Bind(const std::string& listen, Web::FrontEnd& front_end) {
  const auto [host, asked] = ParseAddress(listen);
  const int port = front_end.Bind(host, asked);
  if (port < 0 && errno == 0) {
    throw std::runtime_error("cannot listen on " + listen + ": no such address");
  }
  if (port < 0) {
    Device::ThrowErrno("cannot listen on " + listen);
  }
  return listen.substr(0, listen.rfind(':') + 1) + std::to_string(port);
}

void Serve(const std::string& listen, int page, int socket) {
  AllowManyDescriptors();
  setsid();  // away from root's terminal
  Web::FrontEnd front_end(page);
  close(page);
  front_end.Take(socket);
  const std::string bound = socket < 0 ? Bind(listen, front_end) : AddressOf(socket);
  GiveUpRights();
  std::thread([&] { WaitForTheEnd(front_end); }).detach();
  const Json::Value listening =
      Device::JsonObject({{"kind", Device::kKindListening}, {"address", bound}});
  Device::SendMessage(STDIN_FILENO, Device::ToText(listening), -1);
  const Device::FileDescriptor null(open("/dev/null", O_RDWR | O_CLOEXEC));
  dup2(null.Get(), STDOUT_FILENO);
  dup2(null.Get(), STDERR_FILENO);
  front_end.listen_after_bind();
}

}  // namespace

int main(int argc, char** argv) {
  Device::OccupyStandardStreams();
  std::signal(SIGPIPE, SIG_IGN);
  try {
    if (argc != 4) {
      throw std::runtime_error("usage: kavo-web LISTEN FD SOCKET, started by kavo-device");
    }
    Serve(argv[1], std::atoi(argv[2]), std::atoi(argv[3]));
    return 0;
  } catch (const std::exception& error) {
    std::cerr << "kavo-device: " << error.what() << '\n';
    return 1;
  }
}
