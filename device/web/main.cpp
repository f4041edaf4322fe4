// kavo-web LISTEN FD SOCKET: the device's HTTP front end. Its standard input is the launcher's
// socket, FD the folder of the page, SOCKET where to listen instead, or -1. Gives up root's rights
// before it serves anybody.
#include <grp.h>
#include <netdb.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <iostream>
#include <stdexcept>
#include <string>
#include <thread>

#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/base/socket_message.h"
#include "device/host/wire.h"
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

struct Address {
  std::string host;  // without brackets
  int port = 0;
};

Address ParseAddress(const std::string& listen) {
  constexpr long kLastPort = 65535;
  const std::size_t colon = listen.rfind(':');
  char* end = nullptr;
  const std::string port = colon == std::string::npos ? "" : listen.substr(colon + 1);
  const long number = std::strtol(port.c_str(), &end, 10);
  if (colon == 0 || port.empty() || *end != 0 || number < 0 || number > kLastPort) {
    throw std::runtime_error("'" + listen + "' is not ADDRESS:PORT");
  }
  std::string host = listen.substr(0, colon);
  if (host.front() == '[' && host.back() == ']') {
    host = host.substr(1, host.size() - 2);
  }
  return {host, static_cast<int>(number)};
}

// Ends the process when the launcher asks or is gone.
void WaitForTheEnd(const sigset_t& ending, Web::FrontEnd& front_end) {
  const int signals = signalfd(-1, &ending, SFD_CLOEXEC);
  pollfd sources[] = {{signals, POLLIN, 0}, {STDIN_FILENO, POLLHUP, 0}};
  while (poll(sources, std::size(sources), -1) < 0) {
  }
  front_end.End();
  _exit(0);
}

// Of a socket that is bound, as ADDRESS:PORT.
std::string AddressOf(int socket) {
  sockaddr_storage address{};
  socklen_t size = sizeof address;
  char host[NI_MAXHOST] = "";
  char port[NI_MAXSERV] = "";
  getsockname(socket, reinterpret_cast<sockaddr*>(&address), &size);
  getnameinfo(reinterpret_cast<sockaddr*>(&address), size, host, sizeof host, port, sizeof port,
              NI_NUMERICHOST | NI_NUMERICSERV);
  return (address.ss_family == AF_INET6 ? "[" + std::string(host) + "]" : host) + ":" + port;
}

// Binds the port that was asked for, and returns the address.
std::string Bind(const std::string& listen, Web::FrontEnd& front_end) {
  const Address address = ParseAddress(listen);
  const int port = front_end.Bind(address.host, address.port);
  if (port < 0 && errno == 0) {
    throw std::runtime_error("cannot listen on " + listen + ": no such address");
  }
  if (port < 0) {
    Device::ThrowErrno("cannot listen on " + listen);
  }
  return listen.substr(0, listen.rfind(':') + 1) + std::to_string(port);
}

void Serve(const std::string& listen, int page, int socket) {
  const Web::PageFiles files = Web::ReadPageFiles(page);
  close(page);
  AllowManyDescriptors();
  Web::FrontEnd front_end(files);
  front_end.Take(socket);
  const std::string bound = socket < 0 ? Bind(listen, front_end) : AddressOf(socket);
  GiveUpRights();
  sigset_t ending;
  sigemptyset(&ending);
  for (const int signal_number : {SIGTERM, SIGINT, SIGHUP}) {
    sigaddset(&ending, signal_number);
  }
  sigprocmask(SIG_BLOCK, &ending, nullptr);
  std::thread([&] { WaitForTheEnd(ending, front_end); }).detach();
  const Json::Value listening =
      Device::JsonObject({{"kind", Device::kKindListening}, {"address", bound}});
  Device::SendMessage(STDIN_FILENO, Device::ToText(listening), -1);
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
