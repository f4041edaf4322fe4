#include "device/model/config.h"

#include <crypt.h>
#include <json/json.h>

#include <algorithm>
#include <functional>
#include <limits>
#include <set>
#include <stdexcept>

#include "device/base/code_page.h"
#include "device/base/json_text.h"
#include "device/model/device.h"

namespace Device {

namespace {

const std::set<std::string> kReservedShares = {"home", "homes"};  // every user's own, and all
const std::set<std::string> kReservedVolumes = {kUsersFolder, kConfigFile, kLockFile, kQueueFile};

// Reads members of JSON objects and says on which line of the text something is wrong.
class ConfigReader {
 public:
  explicit ConfigReader(const std::string& text) : text_(text) {}

  using MemberReaders = std::map<std::string, std::function<void(const Json::Value&)>>;

  // Every member must have a reader and every reader its member, but those that are optional.
  void ReadObject(const Json::Value& object, const std::string& what, const MemberReaders& readers,
                  const std::set<std::string>& optional) const {
    Expect(object.isObject(), object, what + " is not an object");
    for (const std::string& key : object.getMemberNames()) {
      const auto found = readers.find(key);
      Expect(found != readers.end(), object[key], "unknown key '" + key + "'");
      found->second(object[key]);
    }
    for (const auto& [key, reader] : readers) {
      Expect(object.isMember(key) || optional.count(key) != 0, object,
             what + " lacks '" + key + "'");
    }
  }

  void ReadArray(const Json::Value& array, const std::string& what,
                 const std::function<void(const Json::Value&)>& reader) const {
    Expect(array.isArray(), array, "'" + what + "' is not an array");
    for (const Json::Value& element : array) {
      reader(element);
    }
  }

  std::string Text(const Json::Value& value) const {
    Expect(value.isString(), value, "expected a text");
    return value.asString();
  }

  bool Bool(const Json::Value& value) const {
    Expect(value.isBool(), value, "expected true or false");
    return value.asBool();
  }

  // A name that can be a folder's.
  std::string Name(const Json::Value& value) const {
    constexpr std::size_t kNameMax = 64;
    std::string name = Text(value);
    const bool is_plain = std::all_of(name.begin(), name.end(), [](char each) {
      return static_cast<unsigned char>(each) > ' ' && each != '/';
    });
    Expect(is_plain && !name.empty() && name.size() <= kNameMax && name[0] != '.' && name[0] != '@',
           value, "'" + name + "' is not a valid name");
    return name;
  }

  unsigned int Number(const Json::Value& value) const {
    Expect(value.isUInt() && value.asUInt() != 0, value, "expected a whole number above 0");
    return value.asUInt();
  }

  void Expect(bool is_right, const Json::Value& value, const std::string& reason) const {
    if (is_right) {
      return;
    }
    const auto end = text_.begin() +
                     std::min<std::ptrdiff_t>(value.getOffsetStart(), std::ptrdiff_t(text_.size()));
    throw std::runtime_error("line " + std::to_string(std::count(text_.begin(), end, '\n') + 1) +
                             ": " + reason);
  }

 private:
  const std::string& text_;
};

// As crypt(3) makes it: "$METHOD$", settings, "$" and so many digits as the method has.
bool IsPasswordHash(const std::string& text) {
  static const std::map<std::string, std::size_t> kDigits = {
      {"$1$", 22},  {"$5$", 43},  {"$6$", 86},  {"$7$", 43}, {"$y$", 43},
      {"$gy$", 43}, {"$2a$", 53}, {"$2b$", 53}, {"$2y$", 53}};
  const std::size_t method_end = text.find('$', 1);
  const std::size_t settings_end =
      text.find_last_not_of("./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz");
  const auto method = kDigits.find(text.substr(0, method_end + 1));
  return method != kDigits.end() && settings_end > method_end && text[settings_end] == '$' &&
         text.size() - settings_end - 1 == method->second &&
         crypt_checksalt(text.c_str()) != CRYPT_SALT_INVALID;
}

std::string ReadPassword(const ConfigReader& reader, const Json::Value& value) {
  std::string hash = reader.Text(value);
  reader.Expect(IsPasswordHash(hash), value,
                "'password' is no hash of crypt(3), as 'openssl passwd -6' prints one");
  return hash;
}

std::string ReadCodePage(const ConfigReader& reader, const Json::Value& value) {
  std::string name = reader.Text(value);
  reader.Expect(CodePage::IsUtf8(name) || CodePage::Open(name), value,
                "unknown code page '" + name + "'");
  return name;
}

uid_t ReadUid(const ConfigReader& reader, const Json::Value& value) {
  reader.Expect(value.isUInt() && value.asUInt() != 0 &&
                    value.asUInt() != std::numeric_limits<std::uint32_t>::max(),
                value, "'uid' is not a number above 0");
  return value.asUInt();
}

Access ReadAccess(const ConfigReader& reader, const Json::Value& value) {
  static const std::map<std::string, Access> kWords = {
      {"rw", Access::kReadWrite}, {"ro", Access::kReadOnly}, {"list-denied", Access::kListDenied}};
  const auto found = kWords.find(reader.Text(value));
  reader.Expect(found != kWords.end(), value, "access is one of 'rw', 'ro', 'list-denied'");
  return found->second;
}

bool HasVolume(const Config& config, const std::string& name) {
  return std::find(config.volumes.begin(), config.volumes.end(), name) != config.volumes.end();
}

void CheckVolume(const ConfigReader& reader, const Json::Value& where, const Config& config,
                 const std::string& volume) {
  reader.Expect(HasVolume(config, volume), where, "no volume '" + volume + "'");
}

void AddVolume(const ConfigReader& reader, const Json::Value& value, Config& config) {
  std::string name = reader.Name(value);
  reader.Expect(kReservedVolumes.count(name) == 0 && !HasVolume(config, name), value,
                "the name '" + name + "' is taken");
  config.volumes.push_back(std::move(name));
}

void AddUser(const ConfigReader& reader, const Json::Value& value, Config& config) {
  User user;
  reader.ReadObject(
      value, "user",
      {{"name", [&](const Json::Value& each) { user.name = reader.Name(each); }},
       {"uid", [&](const Json::Value& each) { user.uid = ReadUid(reader, each); }},
       {"home", [&](const Json::Value& each) { user.home = reader.Name(each); }},
       {"admin", [&](const Json::Value& each) { user.admin = reader.Bool(each); }},
       {"codepage", [&](const Json::Value& each) { user.codepage = ReadCodePage(reader, each); }},
       {"password", [&](const Json::Value& each) { user.password = ReadPassword(reader, each); }}},
      {"admin", "codepage", "password"});
  CheckVolume(reader, value, config, user.home);
  for (const User& other : config.users) {
    reader.Expect(other.name != user.name && other.uid != user.uid, value,
                  "user '" + user.name + "' has the name or uid of another");
  }
  config.users.push_back(std::move(user));
}

void AddShare(const ConfigReader& reader, const Json::Value& value, Config& config) {
  Share share;
  const auto read_access = [&](const Json::Value& access) {
    reader.Expect(access.isObject(), access, "'access' is not an object");
    for (const std::string& user : access.getMemberNames()) {
      reader.Expect(config.FindUser(user) != nullptr, access[user], "no user '" + user + "'");
      share.access[user] = ReadAccess(reader, access[user]);
    }
  };
  reader.ReadObject(
      value, "shared folder",
      {{"name", [&](const Json::Value& each) { share.name = reader.Name(each); }},
       {"volume", [&](const Json::Value& each) { share.volume = reader.Name(each); }},
       {"access", read_access},
       {"encrypted", [&](const Json::Value& each) { share.encrypted = reader.Bool(each); }},
       {"read_only", [&](const Json::Value& each) { share.read_only = reader.Bool(each); }}},
      {"encrypted", "read_only"});
  CheckVolume(reader, value, config, share.volume);
  reader.Expect(config.FindShare(share.name) == nullptr && kReservedShares.count(share.name) == 0,
                value, "the name '" + share.name + "' is taken");
  config.shares.push_back(std::move(share));
}

template <typename T>
const T* FindByName(const std::vector<T>& all, const std::string& name) {
  const auto found =
      std::find_if(all.begin(), all.end(), [&](const T& each) { return each.name == name; });
  return found == all.end() ? nullptr : &*found;
}

}  // namespace

const User* Config::FindUser(const std::string& name) const { return FindByName(users, name); }
const Share* Config::FindShare(const std::string& name) const { return FindByName(shares, name); }

Config ParseConfig(const std::string& file) {
  constexpr char kByteOrderMark[] = "\xEF\xBB\xBF";
  const std::string text = file.rfind(kByteOrderMark, 0) == 0 ? file.substr(3) : file;
  const Json::Value root = ParseJson(text);
  const ConfigReader reader(text);
  Config config;
  Json::Value users;
  Json::Value shares;
  const auto read_volumes = [&](const Json::Value& volumes) {
    reader.ReadArray(volumes, "volumes",
                     [&](const Json::Value& each) { AddVolume(reader, each, config); });
  };
  // Users name volumes, shared folders name both: in that order, wherever they stand in the text.
  reader.ReadObject(root, "the device",
                    {{"volumes", read_volumes},
                     {"users", [&](const Json::Value& each) { users = each; }},
                     {"shares", [&](const Json::Value& each) { shares = each; }},
                     {"jobs_at_once",
                      [&](const Json::Value& each) { config.jobs_at_once = reader.Number(each); }},
                     {"memory_for_jobs_mib",
                      [&](const Json::Value& each) {
                        config.memory_for_jobs = std::uint64_t{reader.Number(each)} << 20U;
                      }}},
                    {"jobs_at_once", "memory_for_jobs_mib"});
  reader.ReadArray(users, "users", [&](const Json::Value& each) { AddUser(reader, each, config); });
  reader.ReadArray(shares, "shares",
                   [&](const Json::Value& each) { AddShare(reader, each, config); });
  return config;
}

}  // namespace Device
