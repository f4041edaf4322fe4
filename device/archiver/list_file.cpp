#include "device/archiver/list_file.h"

#include <algorithm>
#include <memory_resource>
#include <string_view>

#include "device/archiver/failure.h"

namespace Archiver {
namespace {

constexpr char kCannotPack[] = "cannot pack";

// Calls `use` for each part of `text` between separators, the last one included.
template <typename Use>
void ForEachPart(std::string_view text, char separator, Use use) {
  for (size_t begin = 0; begin <= text.size();) {
    const size_t end = std::min(text.find(separator, begin), text.size());
    use(text.substr(begin, end - begin));
    begin = end + 1;
  }
}

[[noreturn]] void Refuse(std::string_view line, const char* reason) {
  throw NamedFailure(kCannotPack, std::string(line), reason);
}

std::string Normalize(std::string_view line) {
  if (line[0] == '/') {
    Refuse(line, "not relative to the working directory");
  }
  if (line.find('\0') != std::string::npos) {
    Refuse(line, "the name holds a zero byte");
  }
  std::string path;
  ForEachPart(line, '/', [&](std::string_view part) {
    if (part == "..") {
      Refuse(line, "leads out of the working directory");
    }
    if (!part.empty() && part != ".") {
      path.append(path.empty() ? "" : "/").append(part);
    }
  });
  if (path.empty()) {
    Refuse(line, "the working directory itself is no source");
  }
  return path;
}

bool HasAncestorIn(const std::unordered_set<std::string>& names, const std::string& path) {
  for (size_t at = path.rfind('/'); at != std::string::npos; at = path.rfind('/', at - 1)) {
    if (names.count(path.substr(0, at)) != 0) {
      return true;
    }
  }
  return false;
}

}  // namespace

std::vector<std::string> ReadSources(const std::string& text, const std::string& list_path) {
  const auto lines = static_cast<size_t>(std::count(text.begin(), text.end(), '\n')) + 1;
  std::vector<std::string> listed;
  listed.reserve(lines);  // so that what `known` looks at stays in its place
  std::pmr::monotonic_buffer_resource nodes;
  std::pmr::unordered_set<std::string_view> known(lines, &nodes);
  ForEachPart(text, '\n', [&](std::string_view line) {
    if (!line.empty()) {
      listed.push_back(Normalize(line));
      if (!known.insert(listed.back()).second) {
        listed.pop_back();
      }
    }
  });
  if (listed.empty()) {
    throw NamedFailure("nothing to pack in list", list_path, "it names no files");
  }
  return listed;
}

std::vector<std::string> WithoutNested(std::vector<std::string> sources,
                                       const std::unordered_set<std::string>& folders) {
  if (!folders.empty()) {
    const auto is_nested = [&](const std::string& source) {
      return HasAncestorIn(folders, source);
    };
    sources.erase(std::remove_if(sources.begin(), sources.end(), is_nested), sources.end());
  }
  return sources;
}

NamesFor7z DivideNames(const std::vector<std::string>& names) {
  NamesFor7z result;
  for (const std::string& name : names) {
    const auto holds = [&](char byte) { return name.find(byte) != std::string::npos; };
    if (IsUtf8(name) && !holds('\r') && !holds('\n')) {
      result.list.append("\"").append(name).append("\"\n");
    } else {
      result.arguments.push_back(name);
    }
  }
  return result;
}

bool IsUtf8(const std::string& text) {
  for (size_t i = 0; i < text.size();) {
    const auto lead = static_cast<unsigned char>(text[i++]);
    if (lead < 0x80) {
      continue;
    }
    const int more = lead >= 0xF0 ? 3 : lead >= 0xE0 ? 2 : 1;
    if (lead < 0xC2 || lead > 0xF4 || text.size() - i < static_cast<size_t>(more)) {
      return false;
    }
    unsigned code = lead & (0x3FU >> more);
    for (int k = 0; k < more; ++k) {
      const auto byte = static_cast<unsigned char>(text[i++]);
      if ((byte & 0xC0U) != 0x80) {
        return false;
      }
      code = code << 6U | (byte & 0x3FU);
    }
    const bool surrogate = code >= 0xD800 && code < 0xE000;
    if (surrogate || code > 0x10FFFF || (more == 2 && code < 0x800) ||
        (more == 3 && code < 0x10000)) {
      return false;
    }
  }
  return true;
}

}  // namespace Archiver
