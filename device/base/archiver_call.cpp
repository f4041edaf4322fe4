#include "device/base/archiver_call.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <utility>

#include "device/base/file_io.h"
#include "device/base/for_each_part.h"
#include "device/base/socket_message.h"

namespace Device {

namespace {

constexpr char kMade[] = "made";
constexpr std::size_t kBlock = 8192;
constexpr std::size_t kMostCallBytes = 128 << 10U;  // what the socket holds before anybody reads

}  // namespace

bool SendArchiverCall(int socket, const ArchiverCall& call) {
  std::vector<std::string> fields = {call.password, call.work_folder,
                                     std::to_string(call.zip_program),
                                     std::to_string(call.link_free), std::to_string(call.memory)};
  fields.insert(fields.end(), call.fixed_folders.begin(), call.fixed_folders.end());
  std::string texts;
  for (const std::string& field : fields) {
    texts.append(field).push_back('\0');
  }
  // The length of what waits in a socket can be asked for by anybody.
  texts.resize((texts.size() / kBlock + 1) * kBlock, '\0');
  if (texts.size() > kMostCallBytes) {
    errno = E2BIG;
    return false;
  }
  return WriteFrame(socket, texts);
}

std::optional<ArchiverCall> ReceiveArchiverCall(int socket) {
  const std::string frame = ReadFrame(socket).value_or("");
  std::vector<std::string> texts;
  ForEachPart(frame, {"\0", 1}, [&](std::string_view text) { texts.emplace_back(text); });
  constexpr std::size_t kHead = 5;  // before the folders
  if (texts.size() < kHead) {
    return std::nullopt;
  }
  texts.erase(std::find(texts.begin() + kHead, texts.end(), ""), texts.end());
  constexpr int kDecimal = 10;
  return ArchiverCall{texts[0],
                      texts[1],
                      std::atoi(texts[2].c_str()),
                      std::atoi(texts[3].c_str()),
                      std::strtoull(texts[4].c_str(), nullptr, kDecimal),
                      {texts.begin() + kHead, texts.end()}};
}

bool SendMadeArchive(int socket, const FileDescriptor& archive) {
  return SendMessage(socket, kMade, archive.Get());
}

FileDescriptor ReceiveMadeArchive(int socket) {
  std::optional<SocketMessage> message = ReceiveMessage(socket, sizeof kMade);
  return message ? std::move(message->descriptor) : FileDescriptor();
}

}  // namespace Device
