// The parsers that read first what others have written, fed with any bytes: by the suite with every
// input in tests/corpus, by libFuzzer from there on. A target throws when a property does not hold,
// and lets out whatever the code under it should not have thrown.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <set>
#include <sstream>
#include <stdexcept>

#include "compress/archiver_output.h"
#include "device/archiver/failure.h"
#include "device/archiver/list_file.h"
#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/host/body.h"
#include "device/model/config.h"

namespace {

void Require(bool holds, const char* property) {
  if (!holds) {
    throw std::logic_error(std::string("does not hold: ") + property);
  }
}

void DeviceConfig(const std::string& input) try {
  const Device::Config config = Device::ParseConfig(input);
  const std::set<std::string> volumes(config.volumes.begin(), config.volumes.end());
  std::set<std::string> users;
  for (const Device::User& user : config.users) {
    Require(users.insert(user.name).second && user.uid != 0, "no name twice, no root");
    Require(volumes.count(user.home) == 1, "a home lies on a volume");
  }
  for (const Device::Share& share : config.shares) {
    Require(volumes.count(share.volume) == 1, "a shared folder lies on a volume");
    Require(share.name.find_first_of("/\n") == std::string::npos && share.name != "..",
            "a shared folder's name is a folder's");
    for (const auto& [user, access] : share.access) {
      Require(users.count(user) == 1, "access is given to users");
    }
  }
} catch (const std::runtime_error& error) {
  Require(std::string(error.what()).rfind("line ", 0) == 0, "a refusal names the line");
}

void SourceList(const std::string& input) try {
  const std::vector<std::string> sources = Archiver::ReadSources(input, "list");
  Archiver::Identities folders;
  for (const std::string& source : sources) {
    folders[source];
  }
  const auto packed = Archiver::WithoutNested(sources, folders);
  const Archiver::NamesFor7z divided = Archiver::DivideNames(packed);
  std::multiset<std::string> again(divided.arguments.begin(), divided.arguments.end());
  std::istringstream list(divided.list);
  for (std::string line; std::getline(list, line);) {
    Require(line.find('\r') == std::string::npos, "a line is read as it is");
    again.insert(line.substr(1, line.size() - 2));
  }
  Require(again == std::multiset<std::string>(packed.begin(), packed.end()), "names come once");
  for (const std::string& source : sources) {
    Require(("/" + source + "/").find("/../") == std::string::npos, "sources lie in the folder");
  }
} catch (const Archiver::Failure& failure) {
  Require(Archiver::NameInError(failure.what()) == failure.what(), "a failure is one plain line");
}

void RequestBody(const std::string& input) try {
  const char* const type =
      input.find('=') < input.find('{') ? "application/x-www-form-urlencoded" : "";
  const Json::Value body = Device::ParseBody(type, input);
  Require(body.isObject(), "a body is an object");
  Require(Device::ParseJson(Device::ToText(body)) == body, "what is sent on comes back");
} catch (const std::runtime_error& error) {
  Require(std::string(error.what()).rfind("body: ", 0) == 0, "a refusal says of what");
}

void ArchiverLine(const std::string& input) try {
  const Zantro::ArchiverEvent event = Zantro::ParseArchiverLine(input);
  Require(event.file.size() == (event.kind == Zantro::ArchiverEvent::kFile ? 1 : 0),
          "a file is one character");
} catch (const std::out_of_range&) {
  Require(input == "Compressing ", "only a file line without a name is refused");
}

const std::map<std::string, void (*)(const std::string&)> kTargets = {
    {"device_config", DeviceConfig},
    {"source_list", SourceList},
    {"request_body", RequestBody},
    {"archiver_line", ArchiverLine}};

}  // namespace

#ifdef KAVO_FUZZ
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const auto target = kTargets.at(std::getenv("KAVO_FUZZ_TARGET"));
  target({reinterpret_cast<const char*>(data), size});
  return 0;
}
#else
#include <gtest/gtest.h>

#include <filesystem>

TEST(Corpus, EachInputKeepsTheProperties) {
  for (const auto& [name, target] : kTargets) {
    const std::filesystem::path folder = std::filesystem::path(KAVO_CORPUS) / name;
    EXPECT_FALSE(std::filesystem::is_empty(folder));
    for (const auto& entry : std::filesystem::directory_iterator(folder)) {
      EXPECT_NO_THROW(target(Device::ReadTextFile(entry.path()))) << entry.path();
    }
  }
}
#endif
