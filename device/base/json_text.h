// JSON values to one line of text and back. Texts keep their bytes, also those that are not UTF-8.
#pragma once

#include <json/json.h>

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <string>
#include <utility>
#include <vector>

namespace Device {

Json::Value JsonObject(std::initializer_list<std::pair<const char*, Json::Value>> members);
Json::Value JsonArray(const std::vector<std::string>& texts);

// Integers of 64 bits and doubles read back as they were.
std::string ToText(const Json::Value& value);

// The same in valid UTF-8, for those outside the device: a byte that is no part of UTF-8 becomes
// the escape \udc80 to \udcff.
std::string ToUtf8Text(const Json::Value& value);

// How deep arrays and objects may lie in each other: in a text, and in a parameter, which tasks and
// trace lines hold within objects of their own.
inline constexpr int kTextDepth = 1000;
inline constexpr int kParamDepth = kTextDepth - 10;

// How many values what a client sends may have: each takes a hundred times the two bytes that it
// can be made of.
inline constexpr std::size_t kMostValues = std::size_t{1} << 17U;

// Throws std::runtime_error, with line, column and reason, for a text that is no JSON, and
// std::bad_alloc, as ThrowMemoryShortage does, for one of too many values. Comments,
// trailing commas, repeated keys and zero bytes are refused. Of each value, getOffsetStart() tells
// the byte of the text at which it begins.
Json::Value ParseJson(const std::string& text, int depth = kTextDepth,
                      std::size_t most_values = SIZE_MAX);

// Takes the escapes \udc80 to \udcff, where they stand alone, for the bytes 0x80 to 0xFF, so that a
// JSON text in UTF-8 can hold any file name.
std::string DecodeByteEscapes(std::string json);

}  // namespace Device
