#include <array>
#include <cctype>
#include <ctime>
#include <sstream>

#include "device/base/socket_message.h"
#include "device/base/utf8.h"
#include "device/host/user_files.h"

namespace Device {

namespace {

std::string HttpTime(std::time_t time) {
  std::array<char, 64> text{};
  std::tm parts{};
  std::strftime(text.data(), text.size(), "%a, %d %b %Y %H:%M:%S GMT", gmtime_r(&time, &parts));
  return text.data();
}

// How a browser is to name what it saves: for old ones in ASCII, for others in UTF-8.
std::string ContentDisposition(const std::string& name) {
  constexpr char kHexDigits[] = "0123456789ABCDEF";
  std::string ascii;
  std::string quoted;
  for (const char each : name) {
    const auto byte = static_cast<unsigned char>(each);
    const bool is_plain = std::isalnum(byte) != 0 || each == '.' || each == '-';
    ascii += is_plain || each == ' ' ? each : '_';
    quoted += is_plain     ? std::string{each}
              : byte < ' ' ? "_"
                           : std::string{'%', kHexDigits[byte / 16], kHexDigits[byte % 16]};
  }
  return "attachment; filename=\"" + ascii +
         (IsUtf8(name) ? "\"; filename*=UTF-8''" + quoted : "\"");
}

}  // namespace

void HandOverFile(int stream, const std::string& user, const std::string& path) {
  const ResolvedPath resolved = ResolveForUser(user, path);
  struct stat status {};
  const FileDescriptor file = OpenFileOf(user, resolved, status);
  const std::string name = resolved.share_path.substr(resolved.share_path.rfind('/') + 1);
  std::ostringstream validator;  // changes with the content
  validator << '"' << status.st_ino << '-' << status.st_size << '-' << status.st_ctim.tv_sec << '-'
            << status.st_ctim.tv_nsec << '"';
  Answer answer(kHttpOk);
  answer.headers = {{"Content-Disposition", ContentDisposition(name)},
                    {"ETag", validator.str()},
                    {"Last-Modified", HttpTime(status.st_mtime)}};
  if (SendAnswer(stream, answer)) {
    SendMessage(stream, user, file.Get());
  }
}

}  // namespace Device
