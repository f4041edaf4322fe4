// A device of its own for each test, in a temporary folder, with the built module loaded.
#ifndef TESTS_DEVICE_FIXTURE_H_
#define TESTS_DEVICE_FIXTURE_H_

#include <gtest/gtest.h>
#include <json/json.h>

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "device/bodies/device.h"
#include "device/host/launcher.h"

// A folder that others can walk into; removed with all that is in it.
class TempFolder {
 public:
  TempFolder();
  ~TempFolder();
  TempFolder(const TempFolder&) = delete;
  TempFolder& operator=(const TempFolder&) = delete;

  const std::string& Path() const { return path_; }

 private:
  std::string path_;
};

// What a program printed and how it ended; a signal's number is shown as 128 and more.
struct Ran {
  int status = -1;
  std::string out;
  std::string err;
};
// Runs a program to its end; the path is taken as it is.
Ran RunProgram(const std::vector<std::string>& arguments, const std::string& folder = "/");

std::string ReadFile(const std::string& path);
void WriteFile(const std::string& path, const std::string& text);

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

  static Json::Value JobParams(const std::vector<std::string>& sources, const std::string& dest);
  Device::Outcome Call(const std::string& method, const Json::Value& params,
                       const std::string& user = "alice", int version = 3, bool is_followed = true);
  Device::Outcome Ask(const std::string& method, const std::string& task_id,
                      const std::string& user = "alice");
  // Starts a job and waits for the status answer that reports its end.
  Json::Value RunJob(const Json::Value& params, const std::string& user = "alice");
  // The same; "path: code" for each error item.
  std::vector<std::string> FailJob(const Json::Value& params, const std::string& user = "alice");
  // Waits, for a while, until the condition holds.
  static bool WaitUntil(const std::function<bool()>& condition);

  // The module's log lines without their file and line, and the calls of platform operations.
  std::vector<std::string> Log() const;
  std::vector<TracedCall> Calls(const std::string& call = "") const;
  // The fork that made the last worker, as the request process saw it.
  TracedCall Fork() const;
  int Worker() const { return Fork().result.isNull() ? -1 : Fork().result.asInt(); }
  // The living processes of the worker's group: itself, the archiver's two, the stock 7z.
  static std::vector<std::string> Group(int worker);

  TempFolder temp_;
  const std::string device_ = temp_.Path() + "/device";
  std::optional<Device::Launcher> launcher_;
};

#endif  // TESTS_DEVICE_FIXTURE_H_
