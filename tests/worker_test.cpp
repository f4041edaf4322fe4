// Every way in which a job fails: items, log lines, and every call between the one that fails and
// the storing of the outcome. The way of a job that succeeds stands in tests/sequences.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <sstream>

#include "device/base/json_text.h"
#include "device/platform/operations.h"
#include "tests/device_fixture.h"
#include "tests/libc_calls.h"

namespace {

// A row names the fault, or the archiver's output, the last call that is as in a job that succeeds,
// the calls from there to the storing of the outcome, and the items and lines.
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
  AddFaults(row.All("fault"));
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
  EXPECT_EQ(log, row.All("log"));

  const bool is_staged = row.All("source").size() == 3 && row.Get("dest") == "/home/z.7z";
  const Strings job =
      NamesOf(ExpectedSequence(is_staged ? "job_of_two_shares" : "job_of_one_share"));
  const Strings end = Behind(NamesOf(ExpectedSequence("failed_job")), "syslog");
  EXPECT_EQ(Sequence(Worker()), UpTo(job, row.Get("last")) + Words(row.Get("after")) + end);
  for (const TracedCall& removal : Calls("KLIBCExecl")) {
    EXPECT_EQ(Plain(Device::ToText(removal.args)), R"(["/bin/rm",187,["-rf","/tmp/lumozip*"]])");
  }
  for (const std::string& path : StagedPaths()) {
    EXPECT_EQ(row.name, "ParentLongerThanSource") << path;
  }
}

INSTANTIATE_TABLE(JobFails, failed_jobs);

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
            Words("syslog KAVO::APIRequest::GetLoginUserName CleanTimeOutTasks _exit"));
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
              {"CleanTimeOutTasks=throw", "Failed to clean tasks"}};
  for (const auto& row : rows) {
    Watch();
    Device::AddFault(row.fault);
    Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"));
    ASSERT_TRUE(WaitUntil([&] { return !Calls("_exit").empty(); }));
    EXPECT_EQ(Log(), Strings{row.line});
    EXPECT_EQ(Calls("_exit").front().args[0], 0);
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

TEST_F(WorkerTest, NamesAndPathsOverTheSystemsLimit) {
  for (const std::size_t size : {std::size_t{256}, std::size_t{1} << 20U}) {
    const std::string path = "/photo/" + std::string(size, 'n');
    EXPECT_EQ(FailJob(JobParams({path}, "/photo/z.zip")), Strings{path + ": 412"});
  }
}

// Resolved paths that no file system holds; an unlisted share is not looked into.
class LongPathTest : public WorkerTest {
 protected:
  void SetUp() override {
    ScriptArchiver("");
    Watch();
    AddFaults({"CheckShareListPrivilege=0", "LumoCheckPath=0", "VolumePathParse=0",
               "FindCommonParent=/", "ACLAccess=0", "LumoCheckFileName=0"});
  }
  static void Resolve(int call, const std::string& field, const std::string& path) {
    const std::string number = std::to_string(call);
    Device::AddFault("PathInfoFactory::create#" + number + R"(={"result":1,"share_name":"share)" +
                     number + R"(","share_real_path":"/",")" + field + R"(":")" + path + "\"}");
  }
};

TEST_F(LongPathTest, ALineThatDoesNotFitIsRefused) {
  const struct {
    const char* field;
    Strings sources;
    std::size_t longest;  // path, with a line of one byte before it and one behind
  } rows[] = {{"real_path", {"/photo/a.txt"}, 4094},
              {"share_path", {"/photo/a.txt", "/music"}, 4117}};
  for (const auto& row : rows) {
    for (const std::size_t excess : {0U, 1U}) {
      SetUp();
      Resolve(1, row.field, "/" + std::string(row.longest + excess - 1, 'n'));
      Resolve(2, row.field, "/n");
      const Json::Value answer = RunJob(JobParams(row.sources, "/photo/z.zip"));
      EXPECT_EQ(answer.isMember("errors"), excess == 1) << row.field;
      EXPECT_EQ(Calls("write").size(), excess == 1 ? 0U : row.sources.size());
    }
  }
}

TEST_F(LongPathTest, PathsAreCutToTheirBuffers) {
  const std::string path = "/" + std::string(4000, 'd') + "/" + std::string(1000, 'n');
  Device::AddFault(R"(LumoFullPathGet={"result":1,"full_path":")" + path + "\"}");
  Resolve(2, "real_path", path);
  RunJob(JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  // A name ends with the 4095th byte of its path, the archive's path with its 4094th.
  EXPECT_EQ(Calls("LumoCheckFileName").front().args[1].asString().size(), 4095U - 4002U);
  EXPECT_EQ(Calls("KLIBCPopenv").front().args[2][3], path.substr(0, 4094));
}

}  // namespace
