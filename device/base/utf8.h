// UTF-8 told from other bytes.
#pragma once

#include <cstddef>
#include <string_view>

namespace Device {

// Bytes of the valid UTF-8 sequence that begins at that place of the text, 0 when there is none.
// Overlong forms, surrogates and what lies above the last code point are not valid.
std::size_t Utf8SequenceLength(std::string_view text, std::size_t at);

bool IsUtf8(std::string_view text);

}  // namespace Device
