// The list between worker and archiver: user paths, separated by zero bytes, through the steps that
// name them there, and back; then the bytes as a list that somebody else wrote.
#include <algorithm>
#include <set>

#include "compress/list_line.h"
#include "compress/split_path.h"
#include "device/archiver/failure.h"
#include "device/archiver/list_file.h"
#include "device/base/utf8.h"
#include "device/platform/lumo/paths.h"
#include "platform/lumo/file_manager.h"
#include "tests/fuzz/targets.h"

namespace {

void CheckRoundTrip(const Strings& paths) {
  Device::OpenDevice device;
  device.root = "/d";
  device.config.users = {{"alice", 1, false, "", "vol1"}};
  device.config.shares = {{"a", "vol1", false, false, {}}, {"b", "vol1", false, false, {}}};
  Strings directories;
  std::set<std::string> shares;
  std::vector<Device::ResolvedPath> sources;
  for (const std::string& path : paths) {
    const Device::ResolvedPath source = Device::Resolve(device, "alice", path);
    if (source.error == 0) {
      sources.push_back(source);
      shares.insert(source.share_name);
      directories.push_back(std::string(Zantro::SplitPath(source.real_path).Directory()) + "/");
    }
  }
  const std::size_t parent_size = FindCommonParent(directories).size() - 1;
  std::string list;
  Strings expected;
  for (const Device::ResolvedPath& source : sources) {
    const std::string name =
        shares.size() > 1 ? source.user_path : source.real_path.substr(parent_size);
    const Zantro::ListLine<Zantro::kListLineSize> line(name);
    Require(line.IsExpressible() == (name.find('\n') == name.npos && name.size() < 4095),
            "a name without a line feed fits");
    if (line.IsExpressible()) {
      list += line.Text();
      expected.push_back(name.substr(1));
    }
  }
  if (!list.empty()) {
    const Strings found = Archiver::ReadSources(list, "list");
    Require(std::set<std::string>(found.begin(), found.end()) ==
                std::set<std::string>(expected.begin(), expected.end()),
            "the archiver finds each name again");
  }
}

void CheckForeignList(const std::string& list) {
  const Strings sources = Archiver::ReadSources(list, list);
  const Strings packed = Archiver::WithoutNested(sources, {sources.begin(), sources.end()});
  for (const std::string& source : sources) {
    const std::string framed = "/" + source + "/";
    Require(framed.find("/../") == framed.npos && framed.find("//") == framed.npos,
            "sources lie in the working directory");
    Require(std::count_if(packed.begin(), packed.end(),
                          [&](const auto& each) { return Device::IsWithin(source, each); }) == 1,
            "each source is packed once");
  }
  const Archiver::NamesFor7z divided = Archiver::DivideNames(packed);
  std::multiset<std::string> again(divided.arguments.begin(), divided.arguments.end());
  for (const std::string& line : SplitAt('\n', divided.list)) {
    Require(line.find('\r') == line.npos && Device::IsUtf8(line), "a line is read as it is");
    if (!line.empty()) {
      again.insert(line.substr(1, line.size() - 2));
    }
  }
  Require(again == std::multiset<std::string>(packed.begin(), packed.end()),
          "each name is handed on once");
}

}  // namespace

void FuzzStagingList(const std::string& input) {
  CheckRoundTrip(SplitAt('\0', input));
  try {
    CheckForeignList(input);
  } catch (const Archiver::Failure& failure) {
    Require(Archiver::NameInError(failure.what()) == failure.what(), "a failure is one plain line");
  }
}
