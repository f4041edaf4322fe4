// What the head of an HTTP request tells before its body is read. No I/O.
#pragma once

#include <httplib.h>

#include <string>

namespace Web {

inline constexpr char kSession[] = "/session";
inline constexpr char kWebApi[] = "/webapi";
inline constexpr char kSize[] = "/size";

// The session cookie's value; empty when there is none.
std::string SessionOf(const httplib::Request& request);

// True when the name that the client knows the device by is not this machine's own, though it came
// in over the loopback address: another site's name may lead here.
bool IsForeignHost(const httplib::Request& request);

// True when the request comes from another site's page. Browsers name the page; others leave it
// out.
bool IsForeign(const httplib::Request& request);

// Leaves gzip alone of the encodings that the client takes: the library's first choice takes a
// hundred times as long. None for a client of HTTP/1.0, to whom an answer has to tell its length.
void ChooseEncoding(httplib::Headers& headers, const std::string& version);

// False for a request that can have a body and has no route: the library would read all of that
// body, of any length, before it says so.
bool HasBodyRoute(const httplib::Request& request);

}  // namespace Web
