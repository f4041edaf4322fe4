// How launcher and front end talk.
//
// The front end sends the launcher messages over a socket of sequenced packets (its standard
// input): {"kind"} in JSON with what the kind needs, and the end of a stream for the answer.
// Everything on that stream is a frame (base/file_io.h). What comes back is an answer, made into
// text by who knows it and passed through to the client, first a frame with its head:
//
//     STATUS \n
//     NAME: VALUE \n        any number of HTTP headers
//
// and then the body in a frame of its own, as the client gets it.
//
// A request is followed by a frame with the path that it is about, or nothing. Of one with a "type"
// the first answer may have the status 100 instead: it is the request's turn. Then the body goes
// there as it came, in frames that an empty one ends, and the answer comes. An answer to
// kKindEvents is followed by frames of server-sent events, as the client gets them; one to
// kKindDownload without a body by a message, the user's name with the file's descriptor.
#pragma once

#include <json/json.h>

#include <cstddef>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace Device {

enum HttpStatus : int {
  kHttpContinue = 100,
  kHttpOk = 200,
  kHttpNoContent = 204,
  kHttpPartialContent = 206,
  kHttpNotModified = 304,
  kHttpBadRequest = 400,
  kHttpUnauthorized = 401,
  kHttpForbidden = 403,
  kHttpNotFound = 404,
  kHttpTimeout = 408,
  kHttpTooLarge = 413,
  kHttpNotDecoded = 415,
  kHttpNoSuchRange = 416,
  kHttpNoArchive = 422,
  kHttpTooMany = 429,
  kHttpInternal = 500,
  kHttpUnavailable = 503
};

inline constexpr char kSessionCookie[] = "session";
inline constexpr char kRetrySeconds[] = "10";  // for who has too much at the same time
inline constexpr std::size_t kMostMessageBytes = 8192;

// For the launcher itself.
inline constexpr char kKindListening[] = "listening";  // "address": ADDRESS:PORT; no stream
inline constexpr char kKindSignIn[] = "sign-in";       // "user", "password", "client"
inline constexpr char kKindSignOut[] = "sign-out";     // "session"
// What a request asks for; with it are its "session", "client", the address that it comes from, and
// "type", the body's, where one comes.
inline constexpr char kKindCall[] = "call";        // body: the API's request
inline constexpr char kKindSession[] = "session";  // who is signed in
inline constexpr char kKindFiles[] = "files";      // these four are about a path
inline constexpr char kKindDownload[] = "download";
inline constexpr char kKindArchive[] = "archive";
inline constexpr char kKindDestination[] = "destination";
inline constexpr char kKindSize[] = "size";  // body: {"paths"}
inline constexpr char kKindTasks[] = "tasks";
inline constexpr char kKindEvents[] = "events";
inline constexpr char kKindCodes[] = "codes";  // no session needed

struct Answer {
  // Body in JSON, a line in UTF-8; none for null.
  explicit Answer(int http_status, const Json::Value& json = {});
  Answer(int http_status, std::string json_text);

  int status;
  std::vector<std::pair<std::string, std::string>> headers;
  std::string body;
};

// An answer {"error": reason}; `retry_seconds`, when it may be tried again.
Answer Refusal(int status, const std::string& reason, const std::string& retry_seconds = "");

// False when the other side is gone.
bool SendAnswer(int stream, const Answer& answer);

// An answer whose body has still to be read. Nothing when the other side is gone without one.
std::optional<Answer> ReceiveAnswerHead(int stream);

}  // namespace Device
