// From a request to the launcher, and from its answer to a response.
#pragma once

#include <httplib.h>

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "device/web/exchange.h"

namespace Web {

inline constexpr std::chrono::seconds kAnswerTime(60);  // to take a part of an answer, an event
inline constexpr char kJson[] = "application/json";

void Respond(httplib::Response& response, const Device::Answer& answer);
void Refuse(httplib::Response& response, int status, const std::string& reason);

// Passes on an answer and then its body, part by part: the request process waits until the client
// has taken a part before it can send more.
void PassOn(const httplib::Request& request, httplib::Response& response,
            const Device::Answer& answer, const std::shared_ptr<Exchange>& exchange);

// Reads the body. False, with the response's status, when it is none, too long or late, or breaks
// off.
bool ReadBody(const httplib::Request& request, const httplib::ContentReader& reader,
              std::size_t most, const std::function<void(const std::string&)>& take,
              httplib::Response& response);

}  // namespace Web
