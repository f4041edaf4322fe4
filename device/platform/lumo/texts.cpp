// Splitting and encoding texts.
#include <algorithm>
#include <map>
#include <stdexcept>
#include <utility>

#include "device/base/for_each_part.h"
#include "device/base/json_text.h"
#include "device/platform/operations.h"
#include "platform/lumo/file_manager.h"

namespace Device {

namespace {

constexpr int kFirstVersionWithArrays = 2;

Json::Value SplitText(const std::string& text, const std::string& separator) {
  Json::Value pieces(Json::arrayValue);
  ForEachPart(text, separator, [&](std::string_view piece) {
    if (!piece.empty()) {
      pieces.append(std::string(piece));
    }
  });
  return pieces;
}

// The value itself when it is an array of texts that can be paths, else an empty one.
Json::Value OnlyTexts(Json::Value array) {
  if (!array.isArray()) {
    return {Json::arrayValue};
  }
  for (const Json::Value& element : array) {
    const char* begin = nullptr;
    const char* end = nullptr;
    if (!element.getString(&begin, &end) || begin == end || std::find(begin, end, '\0') != end) {
      return {Json::arrayValue};
    }
  }
  return array;
}

Json::Value Explode(const Json::Value& value, const std::string& separator, int version) {
  if (!value.isString()) {
    return OnlyTexts(value);
  }
  std::string text = value.asString();
  if (version >= kFirstVersionWithArrays && !text.empty() && text[0] == '[') {
    try {
      return OnlyTexts(ParseJson(DecodeByteEscapes(std::move(text)), kTextDepth, kMostValues));
    } catch (const std::runtime_error&) {
      return {Json::arrayValue};  // begins like an array and is none
    }
  }
  return OnlyTexts(SplitText(text, separator));
}

std::string EncodeHtml(const std::string& text, bool encode_blanks) {
  static const std::map<char, std::string> kReferences = {
      {'&', "&amp;"}, {'<', "&lt;"}, {'>', "&gt;"}, {'"', "&quot;"}, {'\'', "&#39;"}};
  std::string encoded;
  for (const char each : text) {
    const auto reference = kReferences.find(each);
    encoded += reference != kReferences.end() ? reference->second
               : each == ' ' && encode_blanks ? "&nbsp;"
                                              : std::string(1, each);
  }
  return encoded;
}

}  // namespace
}  // namespace Device

using Device::Operation;

Json::Value StringExplodeEx(const Json::Value& value, const std::string& separator, int version,
                            bool reserved) {
  return Operation("StringExplodeEx", value, separator, version, reserved).Run([&] {
    return Device::Explode(value, separator, version);
  });
}

std::string WebUtils::EncodeHtml(const std::string& text, bool encode_blanks) {
  return Operation("WebUtils::EncodeHtml", text, encode_blanks).Run([&] {
    return Device::EncodeHtml(text, encode_blanks);
  });
}
