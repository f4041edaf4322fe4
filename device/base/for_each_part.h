// Taking a text apart.
#pragma once

#include <algorithm>
#include <string_view>

namespace Device {

// Calls `use` for each part of `text` between separators, empty ones and the last included.
template <typename Use>
void ForEachPart(std::string_view text, std::string_view separator, Use use) {
  for (std::size_t begin = 0; begin <= text.size();) {
    const std::size_t end = std::min(text.find(separator, begin), text.size());
    use(text.substr(begin, end - begin));
    begin = end + separator.size();
  }
}

}  // namespace Device
