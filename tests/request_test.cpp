// What a request answers that fails or finds a task in some state, and what "start" stores. The
// ways of requests that succeed stand in tests/sequences.
#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "device/base/json_text.h"
#include "device/platform/operations.h"
#include "device/tasks/task_store.h"
#include "tests/device_fixture.h"

namespace {

// A worker that is not to run has an id that no process has.
class RequestTest : public DeviceTest, public testing::WithParamInterface<TableRow> {};

TEST_P(RequestTest, AnswersWithItsCodeAndLinesAndNoFurtherCall) {
  const TableRow& row = GetParam();
  const std::string method = row.Get("method");
  if (row.Has("data")) {
    Device::TaskRow task;
    task.id = "Zantro_test";
    task.properties["data"] = Device::ParseJson(row.Get("data"));
    Device::TaskStore("alice").AddTask(task);
    for (const auto& file : std::filesystem::directory_iterator(At("users/alice"))) {
      EXPECT_EQ(lchown(file.path().c_str(), geteuid() == 0 ? 65001 : -1, -1), 0);
    }
  }
  AddFaults(row.All("fault"));
  const Json::Value params = Device::ParseJson(row.Get("params", R"({"taskid":"Zantro_test"})"));
  const Device::Outcome outcome = Call(method, params, "alice", std::stoi(row.Get("version", "3")));
  EXPECT_EQ(WithPlaceholders(std::to_string(outcome.code) + " " + Device::ToText(outcome.data)),
            row.Get("answer"));
  EXPECT_EQ(Log(), row.All("log"));

  Strings expected = NamesOf(ExpectedSequence(method));
  if (params.isMember("codepage")) {
    // The user's settings are not asked.
    expected.erase(
        std::find(expected.begin(), expected.end(), "KavoSettings::loadUserJsonSettings"));
  }
  EXPECT_EQ(Sequence(Calls("LumoLibUmask").front().pid),
            UpTo(expected, row.Get("calls")) +
                Words(row.Has("throws") ? "" : "KAVO::APIResponse::SetError") +
                Words("LumoLibRestoreUmask"));
  for (const TracedCall& removal : Calls("LumoLibRemoveFinishedTask")) {
    EXPECT_EQ(removal.args[0].isNull(), !row.Has("data"));
    EXPECT_EQ(removal.args[1].asString(), row.Get("pid", "-1"));
  }
}

INSTANTIATE_TABLE(RequestTest, requests, "method", "params", "version", "data", "fault", "calls",
                  "answer", "throws", "pid", "log");

class StartTest : public DeviceTest {};

TEST_F(StartTest, StoresParametersAsTheyWereGiven) {
  const Json::Value params =
      JobParams({"/photo/a,b", "/photo/c"}, "/photo/z.zip/", R"({"level":5,"codepage":null})");
  const Device::Outcome outcome = Call("start", params, "bob", 2);
  const Json::Value data = Calls("LumoLibBkgTaskInfoCreate").front().args[0];
  EXPECT_EQ(data["pid"], Worker());
  EXPECT_EQ(data["version"], 2);
  EXPECT_EQ(data["params"], Device::ParseJson(R"({"codepage":null,"dest_file_path":"/photo/z.zip/",
                                                  "level":5,"path":["/photo/a,b","/photo/c"]})"));
  EXPECT_TRUE(data.isMember(outcome.data["taskid"].asString()));
}

TEST_F(StartTest, TakesTheCodepageOfTheRequestOrElseOfTheUser) {
  Add("vol1/photo/a", "a");
  Json::Value params = JobParams({"/photo/a"}, "/photo/z.zip");
  RunJob(params, "bob");
  params["codepage"] = "CP437";
  RunJob(params, "bob");
  EXPECT_EQ(Calls("KLIBCPopenv")[0].args[2][6], "-langCP932");
  EXPECT_EQ(Calls("KLIBCPopenv")[1].args[2][6], "-langCP437");
}

}  // namespace
