#include "device/web/responses.h"

#include <algorithm>
#include <array>

#include "device/web/connection.h"

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

void PassOn(const Request& request, Response& response, const Device::Answer& answer,
            const std::shared_ptr<Exchange>& exchange) {
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
