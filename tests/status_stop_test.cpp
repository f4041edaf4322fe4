// Following a job and ending it, from requests of their own.
#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>

#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "device/bodies/task_store.h"
#include "tests/device_fixture.h"
#include "tests/emulation.h"
#include "tests/libc_faults.h"

namespace {

namespace fs = std::filesystem;

using Device::Outcome;

class TaskTest : public DeviceTest {
 protected:
  // A job that goes on until it is stopped: hours of zeros that take no room.
  std::string StartEndlessJob() {
    fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
    Json::Value params = JobParams({"/photo/zeros"}, "/photo/z.7z");
    params["format"] = "7z";
    params["level"] = "best";
    const Outcome started = Call("start", params);
    EXPECT_EQ(started.code, 0);
    return started.data["taskid"].asString();
  }

  // Until 7z has made the file that it writes to.
  bool IsPacking() {
    return WaitUntil([&] { return Group(Worker()).size() >= 4 && EntriesBeside() > 1; });
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

  const auto before = std::chrono::steady_clock::now();
  const Outcome stopped = Ask("stop", task_id);
  EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(kSlowness));
  EXPECT_EQ(stopped.code, 0);
  EXPECT_TRUE(stopped.data.isNull());
  EXPECT_TRUE(Group(Worker()).empty());
  EXPECT_EQ(EntriesBeside(), 1U);
  EXPECT_TRUE(StagedPaths().empty());
  EXPECT_EQ(Ask("status", task_id).code, 599);
}

TEST_F(TaskTest, AnArchiverThatIsKilledFailsTheJob) {
  const std::string task_id = StartEndlessJob();
  ASSERT_TRUE(IsPacking());
  // The newest of the group is the stock 7z.
  int newest = 0;
  for (const fs::directory_entry& process : fs::directory_iterator("/proc")) {
    std::ifstream stat(process.path() / "stat");
    int pid = 0;
    int group = 0;
    std::string skipped;
    if (stat >> pid >> skipped >> skipped >> skipped >> group && group == Worker()) {
      newest = std::max(newest, pid);
    }
  }
  ASSERT_EQ(kill(newest, SIGKILL), 0);
  Outcome last;
  ASSERT_TRUE(WaitUntil([&] {
    last = Ask("status", task_id);
    return last.data["finished"].asBool();
  }));
  EXPECT_EQ(last.data["errors"], Device::ParseJson(R"([{"path":"/photo/z.7z","code":1300}])"));
  EXPECT_FALSE(last.data.isMember("progress"));
  EXPECT_EQ(EntriesBeside(), 1U);
}

TEST_F(TaskTest, AFinishedTaskIsReportedOnce) {
  Add("vol1/photo/a.txt", "a");
  const std::string task_id =
      Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip")).data["taskid"].asString();
  Outcome last;
  ASSERT_TRUE(WaitUntil([&] {
    last = Ask("status", task_id);
    return last.data["finished"].asBool();
  }));
  EXPECT_EQ(last.data["progress"], 1.0);
  EXPECT_EQ(Ask("status", task_id).code, 599);
  // After the error the removal is asked for all the same.
  const TracedCall removal = Calls("LumoLibRemoveFinishedTask").back();
  EXPECT_TRUE(removal.args[0].isNull());
  EXPECT_EQ(removal.args[1], -1);
  EXPECT_EQ(removal.args[2], false);
}

TEST_F(TaskTest, MissingTaskIds) {
  for (const char* method : {"status", "stop"}) {
    EXPECT_EQ(Call(method, Json::Value(Json::objectValue)).code, 101) << method;
  }
  EXPECT_EQ(Calls("LumoLibRemoveFinishedTask").size(), 1U);
  EXPECT_TRUE(Calls("Vesk::TaskMgr::TaskMgr").empty());
  EXPECT_EQ(Ask("status", "").code, 599);
  const Outcome stopped = Ask("stop", "Zantro_unknown");
  EXPECT_EQ(stopped.code, 0);
  EXPECT_TRUE(stopped.data.isNull());
  EXPECT_TRUE(Calls("Vesk::Task::remove").empty());
}

TEST_F(TaskTest, AnotherUserSeesNoTaskAndStopsNone) {
  const std::string task_id = StartEndlessJob();
  ASSERT_TRUE(IsPacking());
  EXPECT_EQ(Ask("status", task_id, "bob").code, 599);
  EXPECT_EQ(Ask("stop", task_id, "bob").code, 0);
  EXPECT_FALSE(Group(Worker()).empty());
  EXPECT_EQ(Ask("status", task_id).code, 0);
  if (geteuid() == 0) {
    struct stat status {};
    ASSERT_EQ(stat(At("users/alice").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0700U);
    EXPECT_EQ(status.st_uid, 65001U);
  }
  EXPECT_EQ(Ask("stop", task_id).code, 0);
  EXPECT_TRUE(Group(Worker()).empty());
}

TEST_F(TaskTest, StopRemovesTheTaskOnEveryPath) {
  struct Row {
    const char* fault;
    const char* log;
    int code;
    bool asks_to_kill;
  };
  const Row rows[] = {
      {"WaitForTaskDataKeyReady=0", "Failed to get json data", 401, false},
      {"Vesk::Task::isFinished=1", "", 0, false},
      {"Vesk::Task::getProperty=null", "Failed to get json data", 401, false},
      {"DoKill=0", "", 401, true},
  };
  for (const Row& row : rows) {
    Device::StopWatching();
    const std::string task_id = "Zantro_" + std::string(row.fault);
    {
      Device::TaskStore store("alice");
      store.AddTask(task_id, {{"data", R"({"pid":1})"}});
    }
    if (geteuid() == 0) {
      for (const fs::directory_entry& file : fs::directory_iterator(At("users/alice"))) {
        ASSERT_EQ(chown(file.path().c_str(), 65001, Device::kUsersGroup), 0);
      }
    }
    std::remove((temp_.Path() + "/trace").c_str());
    std::ofstream(temp_.Path() + "/log", std::ios::trunc).flush();
    Device::OpenTrace(temp_.Path() + "/trace");
    Device::AddFault(row.fault);
    EXPECT_EQ(Ask("stop", task_id).code, row.code) << row.fault;
    EXPECT_EQ(Log().empty() ? "" : Log().back(), row.log);
    EXPECT_EQ(!Calls("DoKill").empty(), row.asks_to_kill) << row.fault;
    EXPECT_EQ(Calls("Vesk::Task::remove").size(), 1U) << row.fault;
    Device::StopWatching();
    EXPECT_EQ(Ask("status", task_id).code, 599) << row.fault;
  }
}

TEST_F(TaskTest, StopNeverKillsAProcessThatIsNoWorker) {
  const std::string task_id = StartEndlessJob();
  ASSERT_TRUE(IsPacking());
  const int worker = Worker();
  // As if the process id were another's now: what the task knows of it no longer fits.
  {
    sqlite3* database = nullptr;
    ASSERT_EQ(sqlite3_open(At("users/alice/store.db").c_str(), &database), SQLITE_OK);
    sqlite3_busy_timeout(database, 10000);  // the worker writes as well
    ASSERT_EQ(
        sqlite3_exec(database, "UPDATE workers SET start_time = 1", nullptr, nullptr, nullptr),
        SQLITE_OK);
    sqlite3_close(database);
  }
  Ask("stop", task_id);
  EXPECT_FALSE(Group(worker).empty());
  kill(-worker, SIGKILL);
  EXPECT_TRUE(WaitUntil([&] { return Group(worker).empty(); }));
}

TEST_F(TaskTest, StatusWithoutDataIsAnErrorAndKeepsTheTask) {
  Add("vol1/photo/a.txt", "a");
  const std::string task_id = StartEndlessJob();
  Device::AddFault("Vesk::Task::getProperty=null");
  EXPECT_EQ(Ask("status", task_id).code, 401);
  EXPECT_EQ(Log().back(), "Failed to get json data");
  EXPECT_EQ(Calls("LumoLibRemoveFinishedTask").back().args[1], -1);
  Device::StopWatching();
  EXPECT_EQ(Ask("status", task_id).code, 0);
  EXPECT_EQ(Ask("stop", task_id).code, 0);
}

}  // namespace
