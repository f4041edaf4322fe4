// The HTTP routes. A route turns a request into a message to the launcher and its answer into a
// response; of users and files it knows what the launcher hands over.
#pragma once

#include <httplib.h>

#include <atomic>
#include <memory>
#include <string>

#include "device/web/exchange.h"

namespace Web {

class FrontEnd : public httplib::Server {
 public:
  // Serves the page that lies in the open folder.
  explicit FrontEnd(int page);

  // Binds the port, any free one for 0, and returns it; -1 with errno when that fails.
  int Bind(const std::string& address, int port);
  // Listens there.
  void Take(int socket) { svr_sock_ = socket; }
  // Waits a while for the POST requests that are being served.
  void End();

 private:
  bool process_and_close_socket(socket_t socket) override;
  void AddRoutes();
  void Ask(const std::string& kind, const httplib::Request& request, httplib::Response& response);
  void StreamEvents(const std::shared_ptr<Exchange>& exchange, httplib::Response& response);

  std::atomic<int> serving_{0};
  std::atomic<bool> is_ending_{false};
};

}  // namespace Web
