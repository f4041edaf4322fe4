// The settings store: what users have set for themselves on the device's desktop.
#pragma once

#include <json/json.h>

class KavoSettings {
 public:
  struct State;

  // The settings of the user of that name. The text is copied; nothing is read yet.
  explicit KavoSettings(const char* user);
  ~KavoSettings();
  KavoSettings(const KavoSettings&) = delete;
  KavoSettings& operator=(const KavoSettings&) = delete;

  // Fills `settings` with an object: one member per desktop application, named like
  // "KAVO.Nolo.App.PersonalSettings.Instance", each an object of its own. False when the user has
  // no readable settings; `settings` is then left as it was.
  bool loadUserJsonSettings(Json::Value& settings);

 private:
  State* state_;
};
