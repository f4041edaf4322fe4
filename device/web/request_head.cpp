#include "device/web/request_head.h"

#include <algorithm>
#include <regex>
#include <string>

#include "device/host/wire.h"

namespace Web {

using httplib::Request;

namespace {

constexpr std::size_t kMostSessionBytes = 64;  // no id is as long

}  // namespace

std::string SessionOf(const Request& request) {
  const std::string cookies = "; " + request.get_header_value("Cookie");
  const std::string name = std::string("; ") + Device::kSessionCookie + "=";
  const std::size_t begin = cookies.find(name);
  if (begin == std::string::npos) {
    return "";
  }
  const std::size_t value = begin + name.size();
  return cookies.substr(value, std::min(cookies.find(';', value) - value, kMostSessionBytes));
}

bool IsForeignHost(const Request& request) {
  const std::string host = request.get_header_value("Host");
  const std::string name = host.substr(0, host.find(':', host.rfind(']') + 1));
  const bool is_loopback =
      request.local_addr.compare(0, 4, "127.") == 0 || request.local_addr == "::1";
  return is_loopback && name != "localhost" && name != "127.0.0.1" && name != "[::1]" &&
         name != request.local_addr;
}

bool IsForeign(const Request& request) {
  const std::string origin = request.get_header_value("Origin");
  const std::size_t host = origin.find("://");
  const auto is_host = [&](const char* field) {
    return host != std::string::npos && origin.substr(host + 3) == request.get_header_value(field);
  };
  // The latter is a proxy's: before another site's page may send it, browsers ask, and are refused.
  return !origin.empty() && !is_host("Host") && !is_host("X-Forwarded-Host");
}

void ChooseEncoding(httplib::Headers& headers, const std::string& version) {
  static const std::regex kGzip("gzip(?!\\s*;\\s*q=0)");
  const auto accepted = headers.find("Accept-Encoding");
  const bool is_gzip = accepted != headers.end() && version == "HTTP/1.1" &&
                       std::regex_search(accepted->second, kGzip);
  headers.erase("Accept-Encoding");
  if (is_gzip) {
    headers.emplace("Accept-Encoding", "gzip");
  }
}

bool HasBodyRoute(const Request& request) {
  const std::string& path = request.path;
  return request.method == "POST"     ? path == kSession || path == kWebApi || path == kSize
         : request.method == "DELETE" ? path == kSession
                                      : request.method == "GET" || request.method == "HEAD";
}

}  // namespace Web
