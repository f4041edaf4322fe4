#include "device/archiver/list_file.h"

#include <algorithm>
#include <string_view>
#include <unordered_set>

#include "device/archiver/failure.h"
#include "device/base/for_each_part.h"
#include "device/base/utf8.h"

namespace Archiver {
namespace {

constexpr char kCannotPack[] = "cannot pack";

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
  Device::ForEachPart(line, "/", [&](std::string_view part) {
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

bool HasAncestorIn(const Identities& names, const std::string& path) {
  for (size_t at = path.rfind('/'); at != std::string::npos; at = path.rfind('/', at - 1)) {
    if (names.count(path.substr(0, at)) != 0) {
      return true;
    }
  }
  return false;
}

}  // namespace

std::vector<std::string> ReadSources(const std::string& text, const std::string& list_path) {
  std::vector<std::string> listed;
  std::unordered_set<std::string> known;
  Device::ForEachPart(text, "\n", [&](std::string_view line) {
    if (!line.empty()) {
      const auto [name, is_new] = known.insert(Normalize(line));
      if (is_new) {
        listed.push_back(*name);
      }
    }
  });
  if (listed.empty()) {
    throw NamedFailure("nothing to pack in list", list_path, "it names no files");
  }
  return listed;
}

std::vector<std::string> WithoutNested(std::vector<std::string> sources,
                                       const Identities& folders) {
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
    if (Device::IsUtf8(name) && !holds('\r') && !holds('\n')) {
      result.list.append("\"").append(name).append("\"\n");
    } else {
      result.arguments.push_back(name);
    }
  }
  return result;
}

}  // namespace Archiver
