#include "device/base/json_text.h"

#include <rapidjson/encodedstream.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <optional>
#include <stdexcept>
#include <system_error>
#include <utility>
#include <vector>

namespace Device {

namespace {

using rapidjson::SizeType;
using Utf8 = rapidjson::UTF8<>;
using Stream = rapidjson::EncodedInputStream<Utf8, rapidjson::MemoryStream>;
using Writer = rapidjson::Writer<rapidjson::StringBuffer>;

constexpr char kHexDigits[] = "0123456789abcdefABCDEF";
constexpr int kHexBase = 16;
constexpr unsigned long kFirstHighSurrogate = 0xD800;
constexpr unsigned long kLastHighSurrogate = 0xDBFF;
constexpr unsigned long kFirstByteEscape = 0xDC80;
constexpr unsigned long kLastByteEscape = 0xDCFF;
constexpr unsigned long kFirstByte = 0x80;

template <typename Number>
std::optional<Number> NumberIn(const char* begin, const char* end) {
  Number number{};
  const auto [stop, error] = std::from_chars(begin, end, number);
  return error == std::errc() && stop == end ? std::optional(number) : std::nullopt;
}

// Makes a value of what the parser comes upon. Its functions answer whether to go on; why not
// stands in `refusal`.
class ValueBuilder : public rapidjson::BaseReaderHandler<Utf8, ValueBuilder> {
 public:
  ValueBuilder(const Stream& stream, int depth)
      : stream_(stream), depth_(static_cast<std::size_t>(depth)) {}

  bool Null() { return Add(Json::Value()); }
  bool Bool(bool value) { return Add(value); }
  bool RawNumber(const char* text, SizeType length, bool /*is_copy*/) {
    const char* end = text + length;
    // As in values that the program makes: unsigned only where it must be.
    if (const auto value = NumberIn<std::int64_t>(text, end)) {
      return Add(Json::Int64{*value});
    }
    if (const auto value = NumberIn<std::uint64_t>(text, end)) {
      return Add(Json::UInt64{*value});
    }
    if (const auto value = NumberIn<double>(text, end)) {
      return Add(*value);
    }
    refusal = "number out of range";
    return false;
  }
  bool String(const char* text, SizeType length, bool /*is_copy*/) {
    return Add(Json::Value(text, text + length));
  }
  bool Key(const char* text, SizeType length, bool /*is_copy*/) {
    key_.assign(text, length);
    if (open_.back()->isMember(key_)) {
      refusal = "Duplicate key: '" + key_ + "'";
    }
    return refusal.empty();
  }
  bool StartObject() { return Open(Json::objectValue); }
  bool StartArray() { return Open(Json::arrayValue); }
  bool EndObject(SizeType /*members*/) { return Close(); }
  bool EndArray(SizeType /*elements*/) { return Close(); }

  Json::Value root;
  std::string refusal;

 private:
  Json::Value& Place(Json::Value value) {
    value.setOffsetStart(static_cast<std::ptrdiff_t>(stream_.Tell()));
    if (open_.empty()) {
      return root = std::move(value);
    }
    if (open_.back()->isArray()) {
      return open_.back()->append(std::move(value));
    }
    return (*open_.back())[key_] = std::move(value);
  }
  bool Add(Json::Value value) {
    Place(std::move(value));
    return true;
  }
  bool Open(Json::ValueType type) {
    if (open_.size() == depth_) {
      refusal = "nested too deep";
      return false;
    }
    open_.push_back(&Place(type));
    return true;
  }
  bool Close() {
    open_.pop_back();
    return true;
  }

  const Stream& stream_;
  std::size_t depth_;
  std::vector<Json::Value*> open_;  // arrays and objects, each within the one before
  std::string key_;
};

std::string PlaceIn(const std::string& text, std::size_t offset) {
  const auto place = text.begin() + static_cast<std::ptrdiff_t>(std::min(offset, text.size()));
  const auto line = std::count(text.begin(), place, '\n') + 1;
  const std::size_t line_end = offset == 0 ? std::string::npos : text.rfind('\n', offset - 1);
  return "line " + std::to_string(line) + ", column " + std::to_string(offset - line_end);
}

void Write(const Json::Value& value, Writer& writer) {
  switch (value.type()) {
    case Json::nullValue:
      writer.Null();
      break;
    case Json::booleanValue:
      writer.Bool(value.asBool());
      break;
    case Json::intValue:
      writer.Int64(value.asInt64());
      break;
    case Json::uintValue:
      writer.Uint64(value.asUInt64());
      break;
    case Json::realValue:
      std::isfinite(value.asDouble()) ? writer.Double(value.asDouble()) : writer.Null();
      break;
    case Json::stringValue: {
      const char* begin = nullptr;
      const char* end = nullptr;
      value.getString(&begin, &end);
      writer.String(begin, static_cast<SizeType>(end - begin));
      break;
    }
    case Json::arrayValue:
      writer.StartArray();
      for (const Json::Value& element : value) {
        Write(element, writer);
      }
      writer.EndArray();
      break;
    case Json::objectValue:
      writer.StartObject();
      for (auto member = value.begin(); member != value.end(); ++member) {
        const std::string name = member.name();
        writer.Key(name.data(), static_cast<SizeType>(name.size()));
        Write(*member, writer);
      }
      writer.EndObject();
      break;
  }
}

}  // namespace

std::string ToText(const Json::Value& value) {
  rapidjson::StringBuffer buffer;
  Writer writer(buffer);
  Write(value, writer);
  return {buffer.GetString(), buffer.GetSize()};
}

Json::Value ParseJson(const std::string& text, int depth) {
  rapidjson::MemoryStream bytes(text.data(), text.size());
  Stream stream(bytes);
  ValueBuilder builder(stream, depth);
  // The library's own reading of numbers is wrong for some of more than twenty digits.
  const rapidjson::ParseResult result =
      rapidjson::Reader().Parse<rapidjson::kParseNumbersAsStringsFlag>(stream, builder);
  if (!result) {
    std::string reason = rapidjson::GetParseError_En(result.Code());
    reason.pop_back();  // its full stop
    throw std::runtime_error(PlaceIn(text, result.Offset()) + ": " +
                             (builder.refusal.empty() ? reason : builder.refusal));
  }
  if (stream.Tell() < text.size()) {
    throw std::runtime_error(PlaceIn(text, stream.Tell()) + ": a zero byte");
  }
  return std::move(builder.root);
}

std::string DecodeByteEscapes(std::string json) {
  constexpr std::size_t kEscape = sizeof "\\udc80" - 1;
  if (json.find("\\u") == std::string::npos) {
    return json;
  }
  const auto code_at = [&](std::size_t at) {
    const bool is_escape = at + kEscape <= json.size() && json[at] == '\\' && json[at + 1] == 'u';
    const std::string digits = is_escape ? json.substr(at + 2, kEscape - 2) : "";
    const bool is_code = is_escape && digits.find_first_not_of(kHexDigits) == std::string::npos;
    return is_code ? std::stoul(digits, nullptr, kHexBase) : 0;
  };
  std::string decoded;
  for (std::size_t at = 0; at < json.size();) {
    const unsigned long code = code_at(at);
    std::size_t length = json[at] == '\\' ? 2 : 1;  // as it stands
    if (code >= kFirstByteEscape && code <= kLastByteEscape) {
      decoded += static_cast<char>(code - kFirstByteEscape + kFirstByte);
      at += kEscape;
      continue;
    }
    if (code >= kFirstHighSurrogate && code <= kLastHighSurrogate) {
      length = 2 * kEscape;  // with the other half of the pair
    }
    decoded.append(json, at, length);
    at += length;
  }
  return decoded;
}

}  // namespace Device
