#include "device/host/download.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cstring>
#include <ctime>
#include <iomanip>
#include <sstream>

#include "device/base/socket_message.h"
#include "device/base/utf8.h"
#include "device/host/user_file.h"

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
  std::string ascii;
  std::ostringstream quoted;
  quoted << std::hex << std::uppercase << std::setfill('0');
  for (std::size_t at = 0; at < name.size();) {
    const std::size_t length = Utf8SequenceLength(name, at);
    const auto first = static_cast<unsigned char>(name[at]);
    const bool is_safe = std::isalnum(first) != 0 || std::strchr(" -._()", first) != nullptr;
    const std::string letter =
        length == 0 || first < ' ' || first == 0x7F ? "_" : name.substr(at, length);
    ascii += is_safe ? name[at] : '_';
    for (const char each : letter) {
      const auto byte = static_cast<unsigned char>(each);
      if (std::isalnum(byte) != 0 || byte == '.') {
        quoted << each;
      } else {
        quoted << '%' << std::setw(2) << int{byte};
      }
    }
    at += std::max<std::size_t>(length, 1);
  }
  return "attachment; filename=\"" + ascii + "\"; filename*=UTF-8''" + quoted.str();
}

// Changes with the file's content.
std::string Validator(const struct stat& status) {
  std::ostringstream text;
  text << '"' << std::hex << status.st_ino << '-' << status.st_size << '-' << status.st_ctim.tv_sec
       << '-' << status.st_ctim.tv_nsec << '"';
  return text.str();
}

}  // namespace

void SendFile(int stream, const std::string& user, const std::string& path) {
  const ResolvedPath resolved = ResolveForUser(user, path);
  struct stat status {};
  const FileDescriptor file = OpenFileOf(user, resolved, status);
  const std::string name = resolved.user_path.substr(resolved.user_path.rfind('/') + 1);
  Answer answer(kHttpOk);
  answer.headers = {{"Content-Disposition", ContentDisposition(name)},
                    {"ETag", Validator(status)},
                    {"Last-Modified", HttpTime(status.st_mtime)}};
  if (SendAnswer(stream, answer)) {
    SendMessage(stream, user, file.Get());
  }
}

}  // namespace Device
