// Every way in which a job fails: items, log lines, and every call between the one that fails and
// the storing of the outcome. The way of a job that succeeds stands in tests/sequences.
#include <dlfcn.h>
#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <regex>
#include <sstream>

#include "device/base/json_text.h"
#include "device/platform/operations.h"
#include "device/tasks/task_store.h"
#include "device/tasks/workers.h"
#include "tests/device_fixture.h"
#include "tests/emulation.h"
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
                 [&](const std::string& item) { return WithPlaceholders(item); });
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
    EXPECT_EQ(WithPlaceholders(Device::ToText(removal.args)),
              R"(["/bin/rm",187,["-rf","/tmp/lumozip*"]])");
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
  // Of each row of alice's store that the statement answers, the first column.
  Strings Store(const std::string& statement) const {
    Strings rows;
    sqlite3* database = nullptr;
    EXPECT_EQ(sqlite3_open(At("users/alice/store.db").c_str(), &database), SQLITE_OK);
    const auto add = [](void* to, int /*columns*/, char** values, char** /*names*/) {
      static_cast<Strings*>(to)->emplace_back(values[0]);
      return 0;
    };
    EXPECT_EQ(sqlite3_exec(database, statement.c_str(), add, &rows, nullptr), SQLITE_OK);
    EXPECT_EQ(sqlite3_close(database), SQLITE_OK);
    return rows;
  }
};

TEST_F(WorkerTest, NotifiesOnceOfAFailureWithTwoArguments) {
  AddFaults({"Vesk::Task::getBoolProperty=1", "LumoLibGetPrivilege=-1:402"});
  RunJob(JobParams({"/photo/a.txt"}, "/photo/<b>.zip"));
  const Json::Value sent = Calls("Vesk::Task::sendNotifyMessageNoEncode").front().args;
  EXPECT_EQ(WithPlaceholders(Device::ToText(sent)),
            R"(["KAVO.Nolo.App.Zantro3.Instance","Zantro_*","tree:leaf_filebrowser",)"
            R"("filebrowser:filebrowser_compress_failed",["/photo/&lt;b&gt;.zip",)"
            R"("the session has ended"]])");
  EXPECT_EQ(Store("SELECT app FROM notifications"), Strings{"KAVO.Nolo.App.Zantro3.Instance"});
  EXPECT_EQ(LastData()["errors"].size(), 1U);
  EXPECT_FALSE(LastData().isMember("notification_arg1"));
}

TEST_F(WorkerTest, TakesAnArchiveOfItselfForDone) {
  const Json::Value answer = RunJob(JobParams({"/photo/z.zip"}, "/photo/z.zip/"));
  EXPECT_FALSE(answer.isMember("errors"));
  const Strings end = After(NamesOf(ExpectedSequence("job_of_one_share")), "unlink");
  EXPECT_EQ(Sequence(Worker()), Words("KLIBCProcFork signal WaitForTaskDataReady") + end);
  RunJob(JobParams({"/photo/z.zip", "/photo/z.zip"}, "/photo/z.zip"));
  EXPECT_EQ(LastData()["errors"].size(), 2U);
}

TEST_F(WorkerTest, LeavesYoungTasksAndLivingWorkersAlone) {
  RunJob(JobParams({"/photo/z.zip"}, "/photo/z.zip"));  // makes the store
  constexpr int kDead = 1 << 30;                        // more than any process id
  const struct {
    std::string id;
    int age;
    bool is_finished;
    int worker;
  } rows[] = {{"finished_yesterday", 24 * 3600 + 60, true, kDead},
              {"finished_today", 24 * 3600 - 60, true, kDead + 1},
              {"died_long_ago", 3600 + 60, false, kDead + 2},
              {"died_just_now", 3600 - 60, false, kDead + 3},
              {"runs", 48 * 3600, false, getppid()}};
  Device::RegisterWorker("alice", getppid());
  for (const auto& row : rows) {
    Device::TaskRow task;
    task.id = row.id;
    task.properties["data"] = Device::ParseJson(R"({"pid":)" + std::to_string(row.worker) + "}");
    Device::StoreOf("alice").AddTask(task);
    Device::StoreOf("alice").UpdateTask(task, {}, row.is_finished);
    row.worker != getppid() ? Device::StoreOf("alice").AddWorker(row.worker, 1) : void();
    Store("UPDATE tasks SET updated = updated - " + std::to_string(row.age) + " WHERE id = '" +
          row.id + "'");
  }
  Device::CloseStores();
  RunJob(JobParams({"/photo/z.zip"}, "/photo/z.zip"));
  const std::string tasks = "SELECT id FROM tasks UNION SELECT task FROM members";
  const std::string workers = "SELECT pid FROM workers ORDER BY pid";
  EXPECT_EQ(Store(tasks), (Strings{"died_just_now", "finished_today", "runs"}));
  EXPECT_EQ(Store(workers), (Strings{std::to_string(getppid()), std::to_string(kDead + 1),
                                     std::to_string(kDead + 3)}));
  Ask("status", "finished_today");
  Ask("stop", "died_just_now");
  EXPECT_EQ(Store(tasks), Strings{"runs"});
  EXPECT_EQ(Store(workers), Strings{std::to_string(getppid())});
}

// The archiver's line about it looks like a failure.
TEST_F(WorkerTest, PacksASourceNamedLikeAnError) {
  const std::string name = "Error: No space left on device";
  std::filesystem::resize_file(Add("vol1/photo/" + name, ""), 30 << 20);
  EXPECT_FALSE(RunJob(JobParams({"/photo/" + name}, "/photo/z.zip")).isMember("errors"));
  EXPECT_EQ(Calls("SaveTaskData").back().args[1]["file"], "\n");  // it was there
  const Ran listing = RunProgram({"/usr/bin/7z", "l", "-ba", At("vol1/photo/z.zip")});
  EXPECT_NE(listing.out.find(name), std::string::npos);
}

TEST_F(WorkerTest, HoldsNoSourcesWhileTheArchiverRuns) {
  if (kIsEmulated || dlsym(RTLD_DEFAULT, "__asan_init") != nullptr) {
    GTEST_SKIP() << "an emulator's memory is among the worker's, and sanitizers keep what is freed";
  }
  const std::string folder = "/" + std::string(200, 'n');
  const std::string path = "/photo" + folder + folder + folder + folder + folder;
  const Strings sources(5000, path);
  Add("vol1" + path, "n");
  ScriptArchiver("");
  const std::string output = temp_.Path() + "/output";
  std::filesystem::remove(output);
  ASSERT_EQ(mkfifo(output.c_str(), 0644), 0);  // the archiver runs until somebody has opened it
  Device::StopTracing();
  const Device::Outcome started = Call("start", JobParams(sources, "/photo/z.zip"));
  int file = -1;
  ASSERT_TRUE(WaitUntil(
      [&] { return (file = open(output.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC)) >= 0; }));
  const std::string memory = "/proc/" + Store("SELECT pid FROM workers").at(0) + "/smaps_rollup";
  const std::string text = ReadFile(memory);
  const std::size_t kilobytes = std::stoul(text.substr(text.find("Private_Dirty:") + 14));
  EXPECT_LT(kilobytes, 6 * sources.size() * path.size() / 1024);  // twice as much with them
  close(file);
  Follow(started.data["taskid"].asString());
}

TEST_F(WorkerTest, DoesNotFinishATaskItCannotRead) {
  Device::AddFault("Vesk::Task::getProperty=null");
  const Device::Outcome started = Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  ASSERT_TRUE(WaitUntil([&] { return !Calls("_exit").empty(); }));
  EXPECT_EQ(Log().front(), "Failed to get task data");
  EXPECT_EQ(Log().back(), "Failed to get json data");
  EXPECT_EQ(After(Sequence(Worker()), "Vesk::Task::getProperty"),
            Words("syslog CleanTimeOutTasks _exit"));
  EXPECT_TRUE(Calls("SaveTaskData").empty());
  StartOver();
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
    StartOver();
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
