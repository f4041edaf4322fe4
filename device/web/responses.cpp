#include "device/web/responses.h"

#include <algorithm>
#include <array>

#include "device/base/json_text.h"
#include "device/web/connection.h"
#include "device/web/request_head.h"

namespace Web {

using httplib::Request;
using httplib::Response;

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
  return Device::JsonObject({{"kind", kind},
                             {"session", SessionOf(request)},
                             {"client", Connection::OfThisThread().Client()}});
}

Asking Ask(Device::ControlKind kind, const Json::Value& asked) {
  Connection::OfThisThread().EndReading();
  return std::make_shared<Exchange>(kind, Device::ToText(asked));
}

Asking Ask(const Json::Value& asked) { return Ask(Device::ControlKind::kRequest, asked); }

void PassOn(const Request& request, Response& response, const Device::Answer& answer,
            const Asking& exchange) {
  Respond(response, answer);
  if (exchange->BodyLeft() == 0) {
    return;
  }
  const auto pass = [exchange](std::size_t /*at*/, httplib::DataSink& sink) {
    std::array<char, 65536> part;
    const std::size_t size = std::min(exchange->BodyLeft(), part.size());
    Connection::OfThisThread().AllowForWriting(kAnswerTime);
    const bool is_passed = exchange->ReadBody(part.data(), size) && sink.write(part.data(), size);
    if (is_passed && exchange->BodyLeft() == 0) {
      sink.done();
    }
    return is_passed;
  };
  if (request.has_header("Accept-Encoding")) {
    response.set_chunked_content_provider(kJson, pass);  // which the library compresses
  } else {
    response.set_header("Content-Length", std::to_string(exchange->BodyLeft()));
    response.set_content_provider(kJson, pass);
  }
}

void PassOn(const Request& request, Response& response, const Asking& exchange) {
  PassOn(request, response, exchange->Receive(), exchange);
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

// As it came: the library would cut a long form.
bool ReadBody(const Request& request, const httplib::ContentReader& reader, std::size_t most,
              const std::function<void(const std::string&)>& take, Response& response) {
  if (request.is_multipart_form_data() ||
      !(request.has_header("Content-Length") || request.has_header("Transfer-Encoding"))) {
    response.status = Device::kHttpBadRequest;
    return false;
  }
  Connection& connection = Connection::OfThisThread();
  std::size_t length = 0;
  const bool is_read = reader([&](const char* data, std::size_t size) {
    connection.NotePart();
    length += size;
    if (length <= most) {
      take({data, size});
    }
    return true;  // to its end: closed with bytes unread, the connection would lose the answer
  });
  connection.EndReading();
  if (length > most) {
    response.status = Device::kHttpTooLarge;
  } else if (!is_read && connection.IsLate()) {
    response.status = Device::kHttpTimeout;
  }
  return is_read && length <= most;
}

}  // namespace Web
