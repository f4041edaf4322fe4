// What "start" refuses before there is a job, and what becomes of the task when something fails.
// The way of a request that succeeds stands in tests/sequences/start.
#include <algorithm>

#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "tests/device_fixture.h"
#include "tests/table.h"

namespace {

using Device::Outcome;

// A row names the last call that is as in a request that succeeds, and those between it and the
// answer.
class StartRefuses : public DeviceTest, public testing::WithParamInterface<TableRow> {};

TEST_P(StartRefuses, WithItsCodeAndLineAndNoFurtherCall) {
  const TableRow& row = GetParam();
  // A worker is not to wait for data that never comes.
  Device::AddFault("WaitForTaskDataReady=0");
  for (const std::string& fault : row.All("fault")) {
    Device::AddFault(fault);
  }
  const Json::Value params = Device::ParseJson(row.Get("params"));
  const Outcome outcome = Call("start", params, "alice", std::stoi(row.Get("version", "3")));
  EXPECT_EQ(std::to_string(outcome.code), row.Get("code"));
  EXPECT_TRUE(outcome.data.isNull());

  Strings expected = NamesOf(ExpectedSequence("start"));
  if (params.isMember("codepage")) {
    // The user's settings are not asked, and the worker's data holds one parameter more.
    expected.erase(
        std::find(expected.begin(), expected.end(), "KavoSettings::loadUserJsonSettings"));
    expected.insert(std::find(expected.begin(), expected.end(), "LumoLibBkgTaskInfoCreate"),
                    "KAVO::APIRequest::GetParam");
  }
  EXPECT_EQ(Sequence(Calls("LumoLibUmask").front().pid),
            UpTo(expected, row.Get("last")) + Words(row.Get("after")) +
                Words(row.Has("log") ? "syslog" : "") +
                Words("KAVO::APIResponse::SetError LumoLibRestoreUmask"));
  const Strings log = Log();  // a worker's lines may be among them
  EXPECT_EQ(log.empty(), !row.Has("log"));
  EXPECT_EQ(std::count(log.begin(), log.end(), row.Get("log")), row.Has("log") ? 1 : 0);
}

INSTANTIATE_TABLE(StartRefuses, refused_starts);

class StartTest : public DeviceTest {};

TEST_F(StartTest, LeavesNoTaskWhenItCannotFork) {
  Device::AddFault("KLIBCProcFork=-1");
  Call("start", JobParams({"/photo/a"}, "/photo/z.zip"));
  const std::string task_id = Calls("Vesk::TaskMgr::getUniqueTaskId").front().result.asString();
  EXPECT_EQ(Ask("status", task_id).code, 599);
}

TEST_F(StartTest, AnswersThoughTheDataWasNotStored) {
  Device::AddFault("WaitForTaskDataReady=0");
  Device::AddFault("Vesk::Task::setProperty#2=0");
  EXPECT_EQ(Call("start", JobParams({"/photo/a"}, "/photo/z.zip")).code, 0);
  const Strings log = Log();  // the worker's lines are among them
  EXPECT_EQ(std::count(log.begin(), log.end(), "Failed to write progress."), 1);
  EXPECT_EQ(Calls("Vesk::Task::endUpdate").size(), 1U);
}

TEST_F(StartTest, AValueThatIsNoTextPassesThroughAsAnException) {
  Json::Value params = JobParams({"/photo/a"}, "/photo/z.zip");
  params["codepage"] = Json::Value(Json::objectValue);
  EXPECT_EQ(Call("start", params).code, 101);
  EXPECT_TRUE(Calls("KAVO::APIResponse::SetError").empty());
  EXPECT_EQ(Log(), Strings{"start: Type is not convertible to string"});
}

TEST_F(StartTest, StoresParametersAsTheyWereGiven) {
  Json::Value params = JobParams({"/photo/a,b", "/photo/c"}, "/photo/z.zip/");
  params["level"] = 5;
  params["codepage"] = Json::Value();
  const Outcome outcome = Call("start", params, "bob", 2);
  const Json::Value data = Calls("LumoLibBkgTaskInfoCreate").front().args[0];
  EXPECT_EQ(data["pid"], Fork().result);
  EXPECT_EQ(data["version"], 2);
  EXPECT_EQ(data["params"], Device::ParseJson(R"({"codepage":null,"dest_file_path":"/photo/z.zip/",
                                                  "level":5,"path":["/photo/a,b","/photo/c"]})"));
  EXPECT_TRUE(data.isMember(outcome.data["taskid"].asString()));
}

TEST_F(StartTest, TakesTheCodepageOfTheRequestOrElseOfTheUser) {
  Add("vol1/photo/a", "a");
  const auto codepage_of = [&](const Json::Value& params, const std::string& user) {
    Watch();
    RunJob(params, user);
    return Calls("KLIBCPopenv").front().args[2][6].asString();
  };
  Json::Value params = JobParams({"/photo/a"}, "/photo/z.zip");
  EXPECT_EQ(codepage_of(params, "bob"), "-langCP932");
  EXPECT_EQ(codepage_of(params, "alice"), "-lang");
  params["codepage"] = "CP437";
  EXPECT_EQ(codepage_of(params, "bob"), "-langCP437");
}

}  // namespace
