// The HTTP routes. A route passes a request on to the launcher and the answer back to the client;
// it knows neither who the user is nor what the device holds.
#pragma once

#include <httplib.h>

#include <string>

#include "device/web/connection.h"
#include "device/web/page_files.h"

namespace Web {

class FrontEnd {
 public:
  explicit FrontEnd(const PageFiles& page);

  // Binds the port, any free one for 0, and returns it; -1 with errno when that fails.
  int Bind(const std::string& address, int port);
  // Takes a port that is bound.
  void Take(int socket) { server_.Take(socket); }
  // Serves until Stop.
  void Listen() { server_.listen_after_bind(); }
  // Refuses new requests, and waits a while for the POST requests that are being served. What else
  // is under way breaks off when the process ends.
  void Stop();

 private:
  void AddRoutes();
  void AddPage(const PageFiles& page);
  void Post(const char* route, void (*handler)(const httplib::Request&,
                                               const httplib::ContentReader&, httplib::Response&));

  static void SignIn(const httplib::Request& request, const httplib::ContentReader& reader,
                     httplib::Response& response);
  static void SignOut(const httplib::Request& request, httplib::Response& response);
  static void CallApi(const httplib::Request& request, const httplib::ContentReader& reader,
                      httplib::Response& response);
  static void AskAboutPath(const char* kind, const httplib::Request& request,
                           httplib::Response& response);
  void StreamEvents(const httplib::Request& request, httplib::Response& response);

  Server server_;
  int socket_ = -1;              // the server's
  std::atomic<int> serving_{0};  // POST requests
  std::atomic<bool> is_ending_{false};
};

}  // namespace Web
