// What the front end asks of the launcher: short messages over a socket of sequenced packets, each
// with the end of a stream on which the answer is expected.
#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "device/base/file_descriptor.h"

namespace Device {

inline constexpr std::size_t kMostControlBytes = 8192;

enum class ControlKind : char {
  kListening = 'l',  // text: ADDRESS:PORT; no stream
  kRequest = 'r',    // the request comes as a frame on the stream; a process of its own reads it
  kSignIn = 'i',     // text: {"user","password"}
  kSignOut = 'o'     // text: the session's id
};

struct ControlMessage {
  ControlKind kind = ControlKind::kRequest;
  std::string text;         // kMostControlBytes at most
  FileDescriptor exchange;  // each frame on it is {"status": HTTP status, "body": JSON}
};

// What a frame from the front end asks for, by its "kind"; beside it "session" and what the kind
// needs.
inline constexpr char kKindCall[] = "call";  // "api", "version", "method", "params", "followed"
inline constexpr char kKindSession[] = "session";  // who is signed in
inline constexpr char kKindFiles[] = "files";      // "path"
inline constexpr char kKindTasks[] = "tasks";
inline constexpr char kKindEvents[] = "events";
inline constexpr char kKindCodes[] = "codes";  // no session needed

// False when the other side is gone.
bool SendControl(int socket, ControlKind kind, const std::string& text, int exchange);

// Nothing when the other side is gone, or what came is no message.
std::optional<ControlMessage> ReceiveControl(int socket);

}  // namespace Device
