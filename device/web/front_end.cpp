#include "device/web/front_end.h"

#include <poll.h>
#include <sys/socket.h>

#include <chrono>
#include <stdexcept>

#include "device/base/json_text.h"
#include "device/web/body.h"
#include "device/web/connection_threads.h"
#include "device/web/request_head.h"

namespace Web {

namespace {

using httplib::Request;
using httplib::Response;

constexpr std::size_t kMostBodyBytes = std::size_t{8} << 20U;
constexpr std::size_t kMostStrangersBytes = std::size_t{64} << 10U;  // of one without a session
constexpr int kBacklog = 1024;
constexpr int kReadTimeout = 10;  // seconds without a byte from a client
constexpr int kHeartbeatMs = 5000;
constexpr std::chrono::seconds kEndGrace(5);
constexpr char kJson[] = "application/json";
constexpr char kPolicy[] =
    "default-src 'none'; script-src 'self'; style-src 'self'; img-src 'self'; connect-src 'self'; "
    "base-uri 'none'; form-action 'none'; frame-ancestors 'none'";

void Respond(Response& response, const Device::Answer& answer) {
  response.status = answer.status;
  for (const auto& [name, value] : answer.headers) {
    response.set_header(name, value);
  }
  if (!answer.body.empty()) {
    response.set_content(answer.body, kJson);
  }
}

void Refuse(Response& response, int status, const std::string& reason) {
  Respond(response, Device::Refusal(status, reason));
}

Json::Value Asked(const Request& request, const char* kind) {
  return Device::JsonObject({{"kind", kind}, {"session", SessionOf(request)}});
}

// Has the request served by a process of the launcher's.
void Serve(const Json::Value& asked, Response& response) {
  Respond(response, Exchange(asked).Receive());
}

const char* ReasonFor(int status) {
  switch (status) {
    case Device::kHttpNotFound:
      return "no such route";
    case Device::kHttpTooLarge:
      return "the body is too long";
    case Device::kHttpInternal:
      return "the front end has failed";
    default:
      return "not a request that is understood";
  }
}

// The body as it came: the library would cut a long form. False, with the response's status, when
// it is none, too long or breaks off.
bool ReadBody(const Request& request, const httplib::ContentReader& reader, std::string& body,
              Response& response) {
  if (request.is_multipart_form_data() ||
      !(request.has_header("Content-Length") || request.has_header("Transfer-Encoding"))) {
    response.status = Device::kHttpBadRequest;
    return false;
  }
  bool is_too_long = false;
  const bool is_read = reader([&](const char* data, std::size_t size) {
    is_too_long = is_too_long || body.size() + size > kMostBodyBytes;
    if (!is_too_long) {
      body.append(data, size);
    }
    return true;  // to its end: closed with bytes unread, the connection would lose the answer
  });
  if (is_too_long) {
    response.status = Device::kHttpTooLarge;
  }
  return is_read && !is_too_long;
}

// What is long is looked into for those alone who are signed in.
bool MayParse(const Request& request, const std::string& body, Response& response) {
  if (body.size() > kMostStrangersBytes) {
    if (request.path == kSession) {
      response.status = Device::kHttpTooLarge;
      return false;
    }
    const Device::Answer answer = Exchange(Asked(request, Device::kKindSession)).Receive();
    if (answer.status != Device::kHttpOk) {
      Respond(response, answer);
      return false;
    }
  }
  return true;
}

}  // namespace

FrontEnd::FrontEnd(const std::map<std::string, PageFile>& files) {
  server_.new_task_queue = [] { return new ConnectionThreads; };
  server_.set_payload_max_length(kMostBodyBytes);
  server_.set_read_timeout(kReadTimeout);
  server_.set_keep_alive_timeout(kReadTimeout);
  // What a refused request leaves unread, or its length read in another way by a proxy, would be
  // taken for the next one of the connection, which the refusal was to prevent.
  server_.set_keep_alive_max_count(1);
  server_.set_tcp_nodelay(true);
  server_.set_socket_options([this](int socket) {
    const int yes = 1;
    setsockopt(socket, SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes);
    socket_ = socket;
  });
  server_.set_default_headers({{"Content-Security-Policy", kPolicy},
                               {"X-Content-Type-Options", "nosniff"},
                               {"Referrer-Policy", "no-referrer"},
                               {"Cross-Origin-Resource-Policy", "same-origin"},
                               {"Cache-Control", "no-store"}});
  server_.set_pre_routing_handler([this](const Request& request, Response& response) {
    // Whole answers only: the library would cut errors too, and send a file once for each range.
    const_cast<Request&>(request).ranges.clear();
    if (is_ending_) {
      Refuse(response, Device::kHttpUnavailable, "the device is ending");
    } else if (IsForeign(request) || IsForeignHost(request)) {
      Refuse(response, Device::kHttpForbidden, "the request comes from another site's page");
    } else if (request.has_header("Content-Encoding")) {
      Refuse(response, Device::kHttpNotDecoded, "the body is in an encoding");
    } else if (!HasBodyRoute(request)) {
      Refuse(response, Device::kHttpNotFound, ReasonFor(Device::kHttpNotFound));
    } else {
      return httplib::Server::HandlerResponse::Unhandled;
    }
    return httplib::Server::HandlerResponse::Handled;
  });
  server_.set_exception_handler(
      [](const Request& /*request*/, Response& response, const std::exception_ptr& /*error*/) {
        Refuse(response, Device::kHttpInternal, ReasonFor(Device::kHttpInternal));
      });
  server_.set_error_handler([](const Request& /*request*/, Response& response) {
    if (response.body.empty()) {
      Refuse(response, response.status, ReasonFor(response.status));
    }
  });
  AddPage(files);
  AddRoutes();
}

void FrontEnd::AddPage(const std::map<std::string, PageFile>& files) {
  for (const auto& [path, file] : files) {
    std::string pattern;
    for (const char each : path) {
      pattern += each == '.' ? "\\." : std::string(1, each);
    }
    server_.Get(pattern, [&file = file](const Request& /*request*/, Response& response) {
      response.set_content(file.content, file.content_type);
    });
  }
}

void FrontEnd::AddRoutes() {
  Post(kSession, &FrontEnd::SignIn);
  Post(kWebApi, &FrontEnd::CallApi);
  server_.Delete(kSession,
                 [this](const Request& request, Response& response,
                        const httplib::ContentReader& /*body*/) { SignOut(request, response); });
  for (const char* kind : {Device::kKindSession, Device::kKindTasks, Device::kKindCodes}) {
    server_.Get(std::string("/") + kind, [kind](const Request& request, Response& response) {
      Serve(Asked(request, kind), response);
    });
  }
  server_.Get("/files", [](const Request& request, Response& response) {
    if (!request.has_param("path")) {
      Refuse(response, Device::kHttpBadRequest, "'path' is missing");
      return;
    }
    Json::Value asked = Asked(request, Device::kKindFiles);
    asked["path"] = request.get_param_value("path");
    Serve(asked, response);
  });
  server_.Get("/events", [this](const Request& request, Response& response) {
    StreamEvents(request, response);
  });
}

void FrontEnd::Post(const char* route,
                    void (FrontEnd::*handler)(const Request&, const Json::Value&, Response&)) {
  server_.Post(route, [this, handler](const Request& request, Response& response,
                                      const httplib::ContentReader& reader) {
    ++serving_;
    const std::shared_ptr<void> counted(&serving_, [this](void*) { --serving_; });
    std::string body;
    try {
      if (ReadBody(request, reader, body, response) && MayParse(request, body, response)) {
        (this->*handler)(request, ParseBody(request.get_header_value("Content-Type"), body),
                         response);
      }
    } catch (const std::runtime_error& error) {
      Refuse(response, Device::kHttpBadRequest, error.what());
    }
  });
}

void FrontEnd::SignIn(const Request& /*request*/, const Json::Value& body, Response& response) {
  const std::string text = Device::ToText(Device::JsonObject(
      {{"user", TextField(body, "user")}, {"password", TextField(body, "password")}}));
  if (text.size() > Device::kMostControlBytes) {
    Refuse(response, Device::kHttpUnauthorized, "wrong user name or password");
    return;
  }
  Respond(response, Exchange(Device::ControlKind::kSignIn, text).Receive());
}

void FrontEnd::SignOut(const Request& request, Response& response) {
  const std::string session = SessionOf(request).substr(0, Device::kMostControlBytes);
  Respond(response, Exchange(Device::ControlKind::kSignOut, session).Receive());
}

void FrontEnd::CallApi(const Request& request, const Json::Value& body, Response& response) {
  Json::Value asked = ApiRequest(body);
  asked["kind"] = Device::kKindCall;
  asked["session"] = SessionOf(request);
  asked["followed"] = streams_.HasAny(asked["session"].asString());
  Serve(asked, response);
}

void FrontEnd::StreamEvents(const Request& request, Response& response) {
  const Json::Value asked = Asked(request, Device::kKindEvents);
  const std::shared_ptr<void> counted = streams_.Open(asked["session"].asString());
  if (counted == nullptr) {
    response.set_header("Retry-After", "10");
    Refuse(response, Device::kHttpTooMany, "too many event streams");
    return;
  }
  const auto exchange = std::make_shared<Exchange>(asked);
  const Device::Answer answer = exchange->Receive();
  if (answer.status != Device::kHttpOk) {
    Respond(response, answer);
    return;
  }
  response.set_chunked_content_provider(
      "text/event-stream", [exchange, counted, this](std::size_t /*at*/, httplib::DataSink& sink) {
        // A comment now and then tells whether the client is still there.
        std::string text = ":\n\n";
        if (exchange->Wait(kHeartbeatMs)) {
          const std::optional<std::string> event = exchange->Next();
          if (!event) {
            sink.done();
            return true;
          }
          text = *event;
        }
        return !is_ending_ && sink.write(text.data(), text.size());
      });
}

int FrontEnd::Bind(const std::string& address, int port) {
  errno = 0;
  const int bound = port == 0                             ? server_.bind_to_any_port(address)
                    : server_.bind_to_port(address, port) ? port
                                                          : -1;
  if (bound >= 0) {
    listen(socket_, kBacklog);
  }
  return bound;
}

void FrontEnd::Stop() {
  is_ending_ = true;
  const auto deadline = std::chrono::steady_clock::now() + kEndGrace;
  while (serving_ > 0 && std::chrono::steady_clock::now() < deadline) {
    poll(nullptr, 0, 1);
  }
}

}  // namespace Web
