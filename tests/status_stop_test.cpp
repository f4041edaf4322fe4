// Following a job and ending it, from requests of their own.
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "device/base/json_text.h"
#include "device/tasks/task_store.h"
#include "device/tasks/user_tasks.h"
#include "device/tasks/workers.h"
#include "tests/device_fixture.h"
#include "tests/libc_calls.h"

namespace {

namespace fs = std::filesystem;

using Device::Outcome;

class TaskTest : public DeviceTest {
 protected:
  // A job that goes on until it is stopped: hours of zeros that take no room.
  std::string StartEndlessJob(const char* params = R"({"format":"7z","level":"best"})") {
    if (!fs::exists(At("vol1/photo/zeros"))) {
      fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
    }
    const Outcome started = Call("start", JobParams({"/photo/zeros"}, "/photo/z.7z", params));
    EXPECT_EQ(started.code, 0);
    return started.data["taskid"].asString();
  }

  // Until 7z has made the file that it writes to.
  bool IsPacking() {
    return WaitUntil([&] { return Group(Worker()).size() >= 3 && EntriesBeside() > 1; });
  }

  // What stands in the archive's folder: the source, and what the archiver makes.
  std::size_t EntriesBeside() const {
    const fs::directory_iterator entries(At("vol1/photo"));
    return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
  }
};

TEST_F(TaskTest, StopEndsWorkerAndArchiverAndLeavesNothing) {
  const std::string task_id = StartEndlessJob();
  ASSERT_TRUE(IsPacking());
  const Outcome running = Ask("status", task_id);
  EXPECT_FALSE(running.data["finished"].asBool());
  EXPECT_EQ(running.data["dest_file_path"], "/photo/z.7z");

  const Outcome stopped = Ask("stop", task_id);
  EXPECT_EQ(stopped.code, 0);
  EXPECT_TRUE(stopped.data.isNull());
  EXPECT_TRUE(Group(Worker()).empty());
  EXPECT_EQ(EntriesBeside(), 1U);
  EXPECT_TRUE(StagedPaths().empty());
  const Strings calls = Sequence(Worker(), true);
  EXPECT_EQ(Strings(calls.end() - 3, calls.end()),
            (Strings{"kill 0,15", "unlink \"/tmp/lumozip*\"", "exit 1"}));
  EXPECT_EQ(Ask("status", task_id).code, 599);
}

// What staging has made has no owner yet when the signal comes in the middle of it.
TEST_F(TaskTest, AStopWhileTheListIsStagedLeavesNoList) {
  Add("vol1/photo/a.txt", "a");
  const struct {
    const char *call, *part;
  } rows[] = {{"mkstemp", "lumozip"}, {"write", "a.txt"}, {"stat", "a.txt"}};
  for (const auto& row : rows) {
    StartOver();
    SetLibcFault({row.call, row.part, 0, SIGTERM});
    EXPECT_EQ(Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip")).code, 0);
    ASSERT_TRUE(WaitUntil([&] { return !Calls("exit").empty(); })) << row.call;
    ASSERT_TRUE(WaitUntil([&] { return Group(Worker()).empty(); }));
    EXPECT_TRUE(StagedPaths().empty()) << row.call;
    EXPECT_TRUE(Calls("KLIBCPopenv").empty());
  }
}

TEST_F(TaskTest, AStopAtTheVeryEndRemovesNoFile) {
  ScriptArchiver("");
  Add("vol1/photo/a.txt", "a");
  SetLibcFault({"_exit", "", 0, SIGTERM});
  RunJob(JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  EXPECT_EQ(After(Sequence(Worker()), "_exit"), Words("kill exit"));
}

TEST_F(TaskTest, AKilledJobIsReportedAsFailed) {
  for (const bool is_worker_killed : {true, false}) {
    StartOver();
    const std::string task_id = StartEndlessJob();
    ASSERT_TRUE(IsPacking());
    for (const pid_t pid : Group(Worker())) {
      if ((pid == Worker()) == is_worker_killed) {
        kill(pid, SIGKILL);
      }
    }
    ASSERT_TRUE(WaitUntil([&] { return Group(Worker()).empty(); }));
    const Json::Value view = Device::TaskView(Device::AllTasks("alice").back(), {});
    EXPECT_NE(view["reason"].asString().find("was killed"), std::string::npos) << view;
    Device::CloseStores();
    const Json::Value answer = Ask("status", task_id).data;
    EXPECT_TRUE(answer["finished"].asBool());
    EXPECT_EQ(Device::ToText(answer["errors"]), R"([{"code":1300,"path":"/photo/z.7z"}])");
    EXPECT_EQ(Ask("status", task_id).code, 599);
  }
}

TEST_F(TaskTest, AFailureThatIsNotMarkedAsTheEndIsReportedOnce) {
  AddFaults({"Vesk::Task::beginUpdate=0", "Vesk::Task::finish=0"});
  const Outcome started = Call("start", JobParams({"/photo/none"}, "/photo/z.zip"));
  const std::string task_id = started.data["taskid"].asString();
  EXPECT_TRUE(Follow(task_id).isMember("errors"));
  EXPECT_EQ(Ask("status", task_id).code, 599);
}

// What the module does not keep.
TEST_F(TaskTest, ATaskShowsWhatTheArchiverTells) {
  Add("vol1/photo/a.txt", "a");
  const struct {
    const char *output, *member, *expected;
  } rows[] = {{"", "archive_size", "145"},
              {"Progress: 29\nError: no", "progress", "0.28999999999999998"},
              {"Error: no room for 'x'\nError: later\n", "reason", "\"no room for 'x'\""}};
  for (const auto& row : rows) {
    if (*row.output != '\0') {
      ScriptArchiver(row.output);
    }
    Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip", R"({"level":"store"})"));
    ASSERT_TRUE(WaitUntil([&] { return Group(Worker()).empty(); }));
    const Device::TaskRow task = Device::AllTasks("alice").back();
    const Json::Value view = Device::TaskView(task, {});
    EXPECT_EQ(Device::ToText(view[row.member]), row.expected) << Device::ToText(view);
    EXPECT_GE(view["ended"].asInt64(), view["started"].asInt64());
    Device::StoreOf("alice").RemoveTask(task.id);
    Device::CloseStores();
  }
}

// Of a "stop" that has died in the middle, in a time that the clock says is yet to come.
TEST_F(TaskTest, AClockThatIsSetBackStopsNoJob) {
  Device::TaskStore store("alice");
  store.AddWorker(1, 1);
  store.NoteStop(1);
  EXPECT_TRUE(Device::IsBeingStopped("alice", 1));
  sqlite3* database = nullptr;
  ASSERT_EQ(sqlite3_open(At("users/alice/store.db").c_str(), &database), SQLITE_OK);
  sqlite3_exec(database, "UPDATE workers SET stopped = stopped + 9", nullptr, nullptr, nullptr);
  ASSERT_EQ(sqlite3_close(database), SQLITE_OK);
  EXPECT_FALSE(Device::IsBeingStopped("alice", 1));
  Device::CloseStores();
}

TEST_F(TaskTest, StopNeverKillsAProcessThatIsNoWorker) {
  const std::string task_id = StartEndlessJob();
  ASSERT_TRUE(IsPacking());
  // As if the process id were another's now: what the task knows of it no longer fits.
  Device::TaskStore("alice").AddWorker(Worker(), 1);
  Ask("stop", task_id);
  EXPECT_FALSE(Group(Worker()).empty());
}

}  // namespace
