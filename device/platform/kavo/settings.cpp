// The users' personal settings, as device.json gives them.
#include "platform/kavo/settings.h"

#include "device/model/device.h"
#include "device/platform/operations.h"

using Device::Operation;

struct KavoSettings::State {
  std::string user;
};

KavoSettings::KavoSettings(const char* user) : state_(nullptr) {
  Operation("KavoSettings::KavoSettings", user).Run([&] { state_ = new State{user}; });
}

KavoSettings::~KavoSettings() { delete state_; }

bool KavoSettings::loadUserJsonSettings(Json::Value& settings) {
  return Operation("KavoSettings::loadUserJsonSettings").Run([&] {
    const Device::User* const user = Device::TheDevice().config.FindUser(state_->user);
    if (user == nullptr) {
      return false;
    }
    settings = Json::Value(Json::objectValue);
    Json::Value& personal = settings["KAVO.Nolo.App.PersonalSettings.Instance"];
    personal = Json::Value(Json::objectValue);
    if (!user->codepage.empty()) {
      personal["codepage"] = user->codepage;
    }
    return true;
  });
}
