// Every way in which a job fails: items, log lines, and every call between the one that fails and
// the storing of the outcome. The way of a job that succeeds stands in tests/sequences.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <regex>
#include <sstream>

#include "device/base/json_text.h"
#include "device/platform/operations.h"
#include "tests/device_fixture.h"
#include "tests/libc_calls.h"

namespace {

class JobFails : public DeviceTest, public testing::WithParamInterface<TableRow> {};

TEST_P(JobFails, WithItsItemsAndLinesAndNoFurtherCall) {
  const TableRow& row = GetParam();
  for (const char* name : {"trip/a.txt", "trip/day/b.txt", "two\nlines"}) {
    Add(std::string("vol1/photo/") + name, "text");
  }
  ASSERT_EQ(symlinkat("/etc", AT_FDCWD, At("vol1/photo/host").c_str()), 0);
  if (row.Has("output")) {
    ScriptArchiver(row.Get("output"));
  }
  for (const std::string& rule : row.All("fault")) {
    Device::AddFault(std::regex_replace(rule, std::regex("DEV"), device_));
  }
  std::istringstream libc(row.Get("libc"));
  LibcFault fault;
  libc >> fault.call >> fault.part >> fault.error_number;
  SetLibcFault(fault);
  const Json::Value params =
      JobParams(row.All("source", {"/photo/trip/a.txt", "/photo/trip/day"}),
                row.Get("dest", "/photo/out.zip"),
                row.Get("params", R"({"mode":"x","level":"x","password":"x"})"));
  Strings items = FailJob(params, row.Get("user", "alice"));
  std::transform(items.begin(), items.end(), items.begin(),
                 [&](const std::string& item) { return Plain(item); });
  EXPECT_EQ(items, row.All("item"));
  Strings log = Log();
  for (std::string& line : log) {
    line.resize(std::min(line.size(), line.find(": __pos")));  // the library's own words
  }
  EXPECT_EQ(log, row.All("log") + row.All("end"));

  const Strings job = NamesOf(ExpectedSequence(row.Get("sequence", "job_of_one_share")));
  EXPECT_EQ(Sequence(Worker()),
            UpTo(job, row.Get("calls")) + NamesOf(ExpectedSequence("failed_job")));
  for (const TracedCall& removal : Calls("KLIBCExecl")) {
    EXPECT_EQ(Plain(Device::ToText(removal.args)), R"(["/bin/rm",187,["-rf","/tmp/lumozip*"]])");
  }
  for (const std::string& path : StagedPaths()) {
    EXPECT_EQ(row.name, "ParentLongerThanSource") << path;
  }
}

INSTANTIATE_TABLE(JobFails, failed_jobs, "fault", "libc", "output", "source", "dest", "params",
                  "user", "sequence", "calls", "item", "log", "end");

class WorkerTest : public DeviceTest {
 protected:
  WorkerTest() { Add("vol1/photo/a.txt", "a"); }
  Json::Value LastData() const { return Calls("Vesk::Task::setProperty").back().args[1]; }
};

TEST_F(WorkerTest, NotifiesOfAFailureWithTwoArguments) {
  AddFaults({"Vesk::Task::getBoolProperty=1", "LumoLibGetPrivilege=-1:402"});
  RunJob(JobParams({"/photo/a.txt"}, "/photo/<b>.zip"));
  const Json::Value sent = Calls("Vesk::Task::sendNotifyMessageNoEncode").front().args;
  EXPECT_EQ(Plain(Device::ToText(sent)),
            R"(["KAVO.Nolo.App.Zantro3.Instance","Zantro_*","tree:leaf_filebrowser",)"
            R"("filebrowser:filebrowser_compress_failed",["/photo/&lt;b&gt;.zip",)"
            R"("the session has ended"]])");
  EXPECT_EQ(LastData()["errors"].size(), 1U);
  EXPECT_FALSE(LastData().isMember("notification_arg1"));
}

TEST_F(WorkerTest, TakesAnArchiveOfItselfForDone) {
  const Json::Value answer = RunJob(JobParams({"/photo/z.zip"}, "/photo/z.zip/"));
  EXPECT_FALSE(answer.isMember("errors"));
  const Strings end = Behind(NamesOf(ExpectedSequence("job_of_one_share")), "unlink");
  EXPECT_EQ(Sequence(Worker()), Words("KLIBCProcFork signal WaitForTaskDataReady") + end);
  RunJob(JobParams({"/photo/z.zip", "/photo/z.zip"}, "/photo/z.zip"));
  EXPECT_EQ(LastData()["errors"].size(), 2U);
}

TEST_F(WorkerTest, DoesNotFinishATaskItCannotRead) {
  Device::AddFault("Vesk::Task::getProperty=null");
  const Device::Outcome started = Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  ASSERT_TRUE(WaitUntil([&] { return !Calls("_exit").empty(); }));
  EXPECT_EQ(Log().front(), "Failed to get task data");
  EXPECT_EQ(Log().back(), "Failed to get json data");
  EXPECT_EQ(Behind(Sequence(Worker()), "Vesk::Task::getProperty"),
            Words("syslog CleanTimeOutTasks _exit"));
  EXPECT_TRUE(Calls("SaveTaskData").empty());
  Watch();
  ASSERT_TRUE(WaitUntil([&] { return Group(Worker()).empty(); }));
  for (int time = 0; time < 2; ++time) {  // until it is removed
    const Device::Outcome status = Ask("status", started.data["taskid"].asString());
    EXPECT_EQ(status.code, 0);
    EXPECT_FALSE(status.data["finished"].asBool());
  }
}

TEST_F(WorkerTest, LogsWhatItCannotStoreAndEndsAllTheSame) {
  const struct {
    const char *fault, *line;
  } rows[] = {{"Vesk::Task::finish=0", "Failed to write progress."},
              {"Vesk::Task::finish=throw", "Failed to store the outcome"},
              {"CleanTimeOutTasks=throw", "Failed to clean tasks"},
              // Of the first progress that comes.
              {"Vesk::Task::getProperty#1=[1]", "Failed to get task data"},
              {"Vesk::Task::getProperty#1=text", "Failed to get task data"},
              {"Vesk::Task::getProperty#1=7", "Failed to get task data"}};
  for (const auto& row : rows) {
    Watch();
    Device::AddFault(row.fault);
    Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"));
    ASSERT_TRUE(WaitUntil([&] { return !Calls("_exit").empty(); }));
    EXPECT_EQ(Log(), Strings{row.line});
    EXPECT_EQ(Calls("_exit").front().args[0], 0);
    EXPECT_FALSE(LastData().isMember("errors")) << row.fault;
  }
}

TEST_F(WorkerTest, AsksOncePerShareAndPassesOverSourcesOfOneThatIsNotListed) {
  Add("vol1/photo/b.txt", "text");
  Add("vol1/music/m.txt", "text");
  Device::AddFault("CheckShareListPrivilege=0");
  EXPECT_FALSE(RunJob(JobParams({"/photo/a.txt", "/music/m.txt", "/photo/b.txt"}, "/photo/z.zip"))
                   .isMember("errors"));
  EXPECT_EQ(Calls("CheckShareListPrivilege").size(), 2U);
  // The second source of the share that was asked about already.
  ASSERT_EQ(Calls("stat").size(), 1U);
  EXPECT_EQ(Calls("stat").front().args[0], At("vol1/photo/b.txt"));
}

TEST_F(WorkerTest, PathsAreCutToTheirBuffersAndTheLongestLineFits) {
  ScriptArchiver("");
  const std::string path = "/" + std::string(4000, 'd') + "/" + std::string(1000, 'n');
  const std::string source = "/" + std::string(4093, 'n');
  AddFaults({"CheckShareListPrivilege=0", "LumoCheckPath=0", "FindCommonParent=/", "ACLAccess=0",
             "LumoCheckFileName=0", "VolumePathParse=0",
             R"(LumoFullPathGet={"result":1,"full_path":")" + path + "\"}",
             R"(PathInfoFactory::create#1={"result":1,"real_path":")" + source + "\"}",
             R"(PathInfoFactory::create#2={"result":1,"real_path":")" + path + "\"}"});
  RunJob(JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  // A name ends with the 4095th byte of its path, the archive's path with its 4094th.
  EXPECT_EQ(Calls("LumoCheckFileName").front().args[1].asString().size(), 4095U - 4002U);
  EXPECT_EQ(Calls("write").front().args[0], "." + source + "\n");
  EXPECT_EQ(Calls("KLIBCPopenv").front().args[2][3], path.substr(0, 4094));
}

}  // namespace
