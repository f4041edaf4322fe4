#include "device/web/front_end.h"

#include <poll.h>
#include <sys/socket.h>

#include <cerrno>
#include <chrono>
#include <memory>
#include <mutex>
#include <stdexcept>

#include "device/base/json_text.h"
#include "device/host/body.h"
#include "device/web/connection.h"
#include "device/web/download.h"
#include "device/web/page_files.h"
#include "device/web/request_head.h"
#include "device/web/responses.h"

namespace Web {

namespace {

using httplib::Request;
using httplib::Response;

constexpr std::size_t kMostBodyBytes = std::size_t{8} << 20U;
constexpr std::size_t kMostSignInBytes = std::size_t{64} << 10U;
constexpr int kBacklog = 1024;
constexpr int kHeartbeatMs = 5000;
constexpr std::chrono::seconds kEndGrace(5);
constexpr std::size_t kMostTypeBytes = 100;  // of a Content-Type, for what it begins with
constexpr char kPolicy[] =
    "default-src 'none'; script-src 'self'; style-src 'self'; img-src 'self'; connect-src 'self'; "
    "base-uri 'none'; form-action 'none'; frame-ancestors 'none'";

// For names in zips, as there are: the first stands for UTF-8.
constexpr char kCodePages[] =
    R"(["","CP437","CP850","CP852","CP866","CP874","CP932","CP936","CP949","CP950","CP1250","CP1251",)"
    R"("CP1252","CP1253","CP1254","CP1255","CP1256","CP1257","CP1258","EUC-JP","EUC-KR","GB18030",)"
    R"("KOI8-R","KOI8-U","ISO-8859-1","ISO-8859-2","ISO-8859-15"])"
    "\n";

// What the launcher is asked, as far as all requests are alike.
Json::Value Asked(const Request& request, const std::string& kind) {
  return Device::JsonObject({{"kind", kind},
                             {"session", SessionOf(request)},
                             {"client", Connection::OfThisThread().Client()}});
}

Json::Value ParseSignIn(const Request& request, std::string body) {
  static std::mutex parsing;  // the values of many bodies at a time would take much memory
  const std::lock_guard<std::mutex> lock(parsing);
  return Device::ParseBody(request.get_header_value("Content-Type"), std::move(body));
}

void SignIn(const Request& request, Response& response, const httplib::ContentReader& reader) {
  std::string body;
  Connection::OfThisThread().BeginBody(false);
  if (!ReadBody(
          request, reader, kMostSignInBytes, [&](const std::string& part) { body += part; },
          response)) {
    return;
  }
  try {
    const Json::Value asked = ParseSignIn(request, std::move(body));
    const Json::Value sign_in =
        Device::JsonObject({{"kind", Device::kKindSignIn},
                            {"user", Device::TextField(asked, "user")},
                            {"password", Device::TextField(asked, "password")},
                            {"client", Connection::OfThisThread().Client()}});
    if (Device::ToText(sign_in).size() > Device::kMostMessageBytes) {
      Refuse(response, Device::kHttpUnauthorized, "wrong user name or password");
      return;
    }
    const auto exchange = std::make_shared<Exchange>(sign_in);
    PassOn(request, response, exchange->Receive(), exchange);
  } catch (const std::runtime_error& error) {
    Refuse(response, Device::kHttpBadRequest, error.what());
  }
}

void SignOut(const Request& request, Response& response, const httplib::ContentReader& /*body*/) {
  const auto exchange = std::make_shared<Exchange>(Asked(request, Device::kKindSignOut));
  PassOn(request, response, exchange->Receive(), exchange);
}

// A request with a body, which is read when it is its turn.
void AskWithBody(const Request& request, Response& response, const httplib::ContentReader& reader) {
  Json::Value asked =
      Asked(request, request.path == kWebApi ? Device::kKindCall : Device::kKindSize);
  asked["type"] = request.get_header_value("Content-Type").substr(0, kMostTypeBytes);
  const auto exchange = std::make_shared<Exchange>(asked);
  Device::Answer answer = exchange->Receive();
  const bool is_users = answer.status == Device::kHttpContinue;
  Connection::OfThisThread().BeginBody(is_users);
  const auto take = [&](const std::string& part) {
    if (is_users) {
      exchange->Send(part);
    }
  };
  if (ReadBody(request, reader, kMostBodyBytes, take, response)) {
    if (is_users) {
      exchange->Send("");
      answer = exchange->Receive();
    }
    PassOn(request, response, answer, exchange);
  }
}

const char* ReasonFor(int status) {
  switch (status) {
    case Device::kHttpNotFound:
      return "no such route";
    case Device::kHttpTimeout:
      return "the body takes too long";
    case Device::kHttpTooLarge:
      return "the body is too long";
    case Device::kHttpInternal:
      return "the front end has failed";
    default:
      return "not a request that is understood";
  }
}

}  // namespace

FrontEnd::FrontEnd(int page) {
  new_task_queue = [] { return new ConnectionThreads; };
  set_tcp_nodelay(true);
  set_socket_options([](int socket) {
    const int yes = 1;
    setsockopt(socket, SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes);
  });
  set_default_headers({{"Content-Security-Policy", kPolicy},
                       {"X-Content-Type-Options", "nosniff"},
                       {"Referrer-Policy", "no-referrer"},
                       {"Cross-Origin-Resource-Policy", "same-origin"},
                       {"Cache-Control", "no-store"}});
  set_pre_routing_handler([this](const Request& request, Response& response) {
    // Whole answers only: the library would cut errors too, and send a file once for each range.
    const_cast<Request&>(request).ranges.clear();
    ChooseEncoding(const_cast<Request&>(request).headers, request.version);
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
  set_post_routing_handler([](const Request& /*request*/, Response& /*response*/) {
    Connection::OfThisThread().AllowForWriting(kAnswerTime);
  });
  set_exception_handler(
      [](const Request& /*request*/, Response& response, const std::exception_ptr& /*error*/) {
        Refuse(response, Device::kHttpInternal, ReasonFor(Device::kHttpInternal));
      });
  set_error_handler([](const Request& /*request*/, Response& response) {
    if (response.body.empty() && !response.content_provider_) {
      Refuse(response, response.status, ReasonFor(response.status));
    }
  });
  AddPage(*this, page);
  AddRoutes();
}

bool FrontEnd::process_and_close_socket(socket_t socket) {
  Connection connection(socket);
  bool is_closed = false;
  // One request each. What a refused one leaves unread, or its length read in another way by a
  // proxy, would be taken for the next one, which the refusal was to prevent.
  return process_request(connection, true, is_closed, nullptr);
}

void FrontEnd::AddRoutes() {
  using Route = std::pair<const char*, HandlerWithContentReader>;
  for (const auto& [path, handler] :
       {Route(kSession, SignIn), Route(kWebApi, AskWithBody), Route(kSize, AskWithBody)}) {
    Post(path, [this, handler = handler](const Request& request, Response& response,
                                         const httplib::ContentReader& reader) {
      ++serving_;
      const std::shared_ptr<void> counted(&serving_, [this](void*) { --serving_; });
      handler(request, response, reader);
    });
  }
  Delete(kSession, SignOut);
  Get("/codepages", [](const Request& /*request*/, Response& response) {
    response.set_content(kCodePages, kJson);
  });
  for (const char* kind :
       {Device::kKindSession, Device::kKindTasks, Device::kKindCodes, Device::kKindEvents}) {
    Get(std::string("/") + kind,
        [this, kind](const Request& request, Response& response) { Ask(kind, request, response); });
  }
  for (const char* kind : {Device::kKindFiles, Device::kKindDownload, Device::kKindArchive,
                           Device::kKindDestination}) {
    Get(std::string("/") + kind, [this, kind](const Request& request, Response& response) {
      if (request.has_param("path")) {
        Ask(kind, request, response);
      } else {
        Refuse(response, Device::kHttpBadRequest, "'path' is missing");
      }
    });
  }
}

void FrontEnd::Ask(const std::string& kind, const Request& request, Response& response) {
  const auto exchange = std::make_shared<Exchange>(Asked(request, kind));
  exchange->Send(request.get_param_value("path"));
  const Device::Answer answer = exchange->Receive();
  if (answer.status != Device::kHttpOk || exchange->BodyLeft() > 0) {
    PassOn(request, response, answer, exchange);
  } else if (kind == Device::kKindEvents) {
    StreamEvents(exchange, response);
  } else if (std::optional<Device::SocketMessage> file = exchange->ReceiveFile()) {
    SendFile(request, response, answer, std::move(*file));
  } else {
    Refuse(response, Device::kHttpInternal, "the request ended without an answer");
  }
}

void FrontEnd::StreamEvents(const std::shared_ptr<Exchange>& exchange, Response& response) {
  response.set_chunked_content_provider(
      "text/event-stream", [exchange, this](std::size_t /*at*/, httplib::DataSink& sink) {
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
        Connection::OfThisThread().AllowForWriting(kAnswerTime);
        return !is_ending_ && sink.write(text.data(), text.size());
      });
}

int FrontEnd::Bind(const std::string& address, int port) {
  errno = 0;
  const int bound = port == 0 ? bind_to_any_port(address) : bind_to_port(address, port) ? port : -1;
  if (bound >= 0) {
    ::listen(svr_sock_, kBacklog);
  }
  return bound;
}

void FrontEnd::End() {
  is_ending_ = true;
  const auto deadline = std::chrono::steady_clock::now() + kEndGrace;
  while (serving_ > 0 && std::chrono::steady_clock::now() < deadline) {
    poll(nullptr, 0, 1);
  }
}

}  // namespace Web
