// The HTTP routes. A route turns a request into a frame for the launcher and its answer into a
// response; it knows neither users nor files.
#pragma once

#include <httplib.h>

#include <map>
#include <string>

#include "device/web/exchange.h"
#include "device/web/page_files.h"
#include "device/web/stream_count.h"

namespace Web {

class FrontEnd {
 public:
  explicit FrontEnd(const std::map<std::string, PageFile>& files);

  // Binds the port, any free one for 0, and returns it; -1 with errno when that fails.
  int Bind(const std::string& address, int port);
  // Serves until Stop.
  void Listen() { server_.listen_after_bind(); }
  // Lets the requests that are being served end, for a while.
  void Stop();

 private:
  void AddRoutes();
  void AddPage(const std::map<std::string, PageFile>& files);
  void Post(const char* route, void (FrontEnd::*handler)(const httplib::Request&,
                                                         const Json::Value&, httplib::Response&));

  void SignIn(const httplib::Request& request, const Json::Value& body,
              httplib::Response& response);
  void SignOut(const httplib::Request& request, httplib::Response& response);
  void CallApi(const httplib::Request& request, const Json::Value& body,
               httplib::Response& response);
  void StreamEvents(const httplib::Request& request, httplib::Response& response);

  httplib::Server server_;
  int socket_ = -1;  // the server's
  StreamCount streams_;
  std::atomic<int> serving_{0};
  std::atomic<bool> is_ending_{false};
};

}  // namespace Web
