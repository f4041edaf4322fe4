// A device of its own for each test, in a temporary folder, with the built module loaded.
#pragma once

#include <gtest/gtest.h>
#include <json/json.h>

#include <functional>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "device/host/launcher.h"
#include "device/model/device.h"
#include "tests/programs.h"
#include "tests/table.h"

// What is built beside the test program: the module, kavo-device, scripted-7z.
std::string Built(const std::string& name);
std::string ModulePath();

// The calls that stand in tests/sequences under that name, one a line; the names alone.
Strings ExpectedSequence(const std::string& name);
Strings NamesOf(Strings sequence);
// Of "CALL#N + CALL...", their beginning up to and with the Nth such call, the first without "#N",
// and the other calls.
Strings UpTo(const Strings& names, const std::string& calls);
// Their end behind the last CALL.
Strings After(const Strings& names, const std::string& call);
Strings operator+(Strings first, const Strings& second);

struct TracedCall {
  int pid = 0;
  std::string call;
  Json::Value args;
  Json::Value result;
};

// Users alice (administrator), bob (code page CP932), carol; shares photo and music on vol1, the
// encrypted vault and the read-only attic on vol2.
class DeviceTest : public testing::Test {
 protected:
  DeviceTest();
  ~DeviceTest() override;

  // A file of a share or volume, "vol1/photo/a.txt", owned by alice.
  std::string Add(const std::string& path, const std::string& text);
  std::string At(const std::string& path) const { return device_ + "/" + path; }

  static void AddFaults(const Strings& rules);
  // Of "start", with options as JSON.
  static Json::Value JobParams(const Strings& sources, const std::string& dest,
                               const std::string& options = "{}");
  static Device::Request MakeRequest(const std::string& method, const Json::Value& params,
                                     const std::string& user = "alice");
  Device::Outcome Call(const std::string& method, const Json::Value& params,
                       const std::string& user = "alice", int version = 3);
  Device::Outcome Ask(const std::string& method, const std::string& task_id,
                      const std::string& user = "alice");
  // The status answer that reports the end of a job, after waiting for it.
  Json::Value Follow(const std::string& task_id, const std::string& user = "alice");
  // Starts a job and follows it until its worker is gone.
  Json::Value RunJob(const Json::Value& params, const std::string& user = "alice");
  // The same; "path: code" for each error item.
  Strings FailJob(const Json::Value& params, const std::string& user = "alice");
  // Waits, for a while, until the condition holds.
  static bool WaitUntil(const std::function<bool()>& condition);

  // The module's log lines without their file and line, with placeholders.
  Strings Log() const;
  // The calls of one operation, or of all.
  std::vector<TracedCall> Calls(const std::string& call = "") const;
  // The last worker's process id, -1 when there was none.
  int Worker() const;
  // The living processes of the worker's group: itself, the archiver, the stock 7z.
  static std::set<pid_t> Group(pid_t worker);
  // What a process called, libc's calls by the module among it: one line for each, the name and,
  // if asked for, the arguments with placeholders. Getters of the request and of the task's id are
  // left out: nothing depends on when they are called.
  Strings Sequence(int pid, bool with_arguments = false) const;
  // What is not the same in every run replaced: DEV the device's folder, SID, PID the last worker's
  // process id, and * for a time and the rest of a task's id or a temporary name.
  std::string WithPlaceholders(std::string text) const;

  // Forgets fault rules, trace and log so far, and watches on.
  void StartOver();
  // The archiver prints this text and ends well, from now on.
  void ScriptArchiver(const std::string& text);

  TempFolder temp_;
  const std::string device_ = temp_.Path() + "/device";
  std::optional<Device::Launcher> launcher_;
};
