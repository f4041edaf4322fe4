#include "device/web/download.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <regex>
#include <string>

#include "device/web/connection.h"
#include "device/web/responses.h"

namespace Web {

using httplib::Request;
using httplib::Response;

namespace {

constexpr std::size_t kMostOfOne = 16;

struct Places {
  std::mutex mutex;
  std::map<std::string, std::size_t> taken;  // by user
};

// One of the user's, until the last copy goes; null when none is free.
std::shared_ptr<void> TakePlace(const std::string& user) {
  static auto& places = *new Places;  // threads that use it end with the process
  const std::lock_guard<std::mutex> lock(places.mutex);
  if (places.taken[user] >= kMostOfOne) {
    return nullptr;
  }
  ++places.taken[user];
  return {&places, [user](void*) {
            const std::lock_guard<std::mutex> ended(places.mutex);
            --places.taken[user];
          }};
}

struct Part {
  std::int64_t begin;
  std::int64_t end;
};

// What a "Range" header asks for: the whole when it is none of a single range, as HTTP has it.
// Nothing when no byte lies there.
std::optional<Part> PartFor(const std::string& header, std::int64_t size) {
  static const std::regex kRange("bytes=(\\d*)-(\\d*)");
  std::smatch range;
  if (!std::regex_match(header, range, kRange) || range.length(1) + range.length(2) == 0) {
    return Part{0, size};
  }
  const auto number = [&](std::size_t at) {
    return std::strtoll(range.str(at).c_str(), nullptr, 10);
  };
  Part part = {number(1), size};
  if (range.length(1) == 0) {
    part.begin = size - std::min<std::int64_t>(number(2), size);  // so many at the end
  } else if (range.length(2) > 0) {
    part.end = std::min<std::int64_t>(number(2), size - 1) + 1;
  }
  return part.begin < part.end ? std::optional(part) : std::nullopt;
}

// A range of what the client has begun to fetch: of another content it would be of no use.
bool IsSame(const Request& request, const Response& response) {
  const std::string begun = request.get_header_value("If-Range");
  return begun.empty() || begun == response.get_header_value("ETag") ||
         begun == response.get_header_value("Last-Modified");
}

}  // namespace

void SendFile(const Request& request, Response& response, const Device::Answer& answer,
              Device::SocketMessage message) {
  const std::shared_ptr<void> place = TakePlace(message.bytes);
  if (!place) {
    Respond(response, Device::Refusal(Device::kHttpTooMany, "too many downloads at the same time",
                                      Device::kRetrySeconds));
    return;
  }
  const auto file = std::make_shared<Device::FileDescriptor>(std::move(message.descriptor));
  struct stat status {};
  fstat(file->Get(), &status);
  const std::string size = std::to_string(status.st_size);
  Respond(response, answer);
  response.set_header("Accept-Ranges", "bytes");
  const bool has_range = request.method == "GET" && IsSame(request, response);
  const std::optional<Part> part =
      PartFor(has_range ? request.get_header_value("Range") : "", status.st_size);
  if (!part) {
    response.headers.erase("Content-Disposition");
    response.set_header("Content-Range", "bytes */" + size);
    Refuse(response, Device::kHttpNoSuchRange, "the file has " + size + " bytes");
    return;
  }
  if (part->end - part->begin < status.st_size) {
    response.status = Device::kHttpPartialContent;
    response.set_header("Content-Range", "bytes " + std::to_string(part->begin) + "-" +
                                             std::to_string(part->end - 1) + "/" + size);
  }
  // Not by the library's count of bytes, which has 32 bits on some machines.
  response.set_header("Content-Length", std::to_string(part->end - part->begin));
  response.set_content_provider(
      "application/octet-stream", [file, place, at = part->begin, end = part->end](
                                      std::size_t /*at*/, httplib::DataSink& sink) mutable {
        std::array<char, 65536> block;
        const auto most = std::min<std::int64_t>(end - at, block.size());
        const ssize_t got = pread(file->Get(), block.data(), static_cast<std::size_t>(most), at);
        at += got;
        Connection::OfThisThread().AllowForWriting(kAnswerTime);
        if (got < 0 || (got == 0 && at < end) || !sink.write(block.data(), got)) {
          return false;
        }
        if (at == end) {
          sink.done();
        }
        return true;
      });
}

}  // namespace Web
