// device.json: whole and valid, or refused with the line.
#include <algorithm>
#include <cstdio>
#include <set>

#include "device/model/config.h"
#include "tests/fuzz/targets.h"

void FuzzDeviceConfig(const std::string& input) {
  try {
    const Device::Config config = Device::ParseConfig(input);
    std::set<std::string> users;
    const std::set<std::string> volumes(config.volumes.begin(), config.volumes.end());
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
    unsigned long line = 0;
    Require(std::sscanf(error.what(), "line %lu: ", &line) == 1, "a refusal names the line");
    const auto is_end = [](char each) { return each == '\n' || each == '\r'; };
    Require(line <= 1U + std::count_if(input.begin(), input.end(), is_end),
            "the line is one of the text's");
  }
}
