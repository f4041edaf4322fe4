// The store of tasks: read and written piece by piece, damaged, and without room.
#include <sqlite3.h>

#include <csignal>
#include <filesystem>
#include <map>

#include "device/base/json_text.h"
#include "device/tasks/task_store.h"
#include "device/tasks/user_tasks.h"
#include "tests/device_fixture.h"

namespace {

namespace fs = std::filesystem;

class StoreTest : public DeviceTest {
 protected:
  StoreTest() { Add("vol1/photo/a.txt", "a"); }
  // What "start" and the "status" that reports the end answer.
  int RunJobs() {
    const Device::Outcome started = Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"));
    EXPECT_TRUE(WaitUntil([&] {
      const Device::Outcome status = Ask("status", started.data["taskid"].asString());
      return status.code != 0 || status.data["finished"].asBool();
    }));
    return started.code;
  }
  const std::string file_ = At("users/alice/store.db");
};

TEST_F(StoreTest, ADamagedStoreIsSetAsideAndTheDeviceGoesOn) {
  ASSERT_EQ(RunJobs(), 0);
  sqlite3* database = nullptr;
  ASSERT_EQ(sqlite3_open(file_.c_str(), &database), SQLITE_OK);
  sqlite3_exec(database, "PRAGMA wal_checkpoint(TRUNCATE)", nullptr, nullptr, nullptr);
  ASSERT_EQ(sqlite3_close(database), SQLITE_OK);
  const std::string whole = ReadFile(file_);
  std::string torn = whole;
  torn.replace(torn.size() / 4, torn.size() / 2, torn.size() / 2, '?');
  std::string renamed = whole;
  renamed[renamed.find("updated INTEGER")] = '?';
  for (const std::string& content :
       {std::string("garbage"), torn, whole.substr(0, 5000), renamed}) {
    for (const char* part : {"-wal", "-shm"}) {
      fs::remove(file_ + part);
    }
    fs::resize_file(file_, 0);
    WriteFile(file_, content);
    StartOver();
    RunJobs();  // may meet the damage on its way
    EXPECT_EQ(RunJobs(), 0);
    Strings said;
    for (const std::string& line : Log()) {
      if (line.find(" is set aside as ") != std::string::npos) {
        said.push_back(line);
      }
    }
    EXPECT_EQ(said.size(), 1U) << content.size();
  }
}

TEST_F(StoreTest, ARowSeesWhatAnotherHasChangedMemberByMember) {
  Device::TaskStore store("alice");
  Device::TaskRow mine;
  mine.id = "Zantro_test";
  mine.properties["data"] = Device::ParseJson(R"({"kept":[1,"x"],"gone":1,"text":"a"})");
  store.AddTask(mine);
  Device::TaskRow other = *store.FindTask(mine.id);
  const char* const steps[] = {R"({"kept":[1,"x"],"text":"b","new":{"":null}})",
                               "7",
                               "{}",
                               R"({"text":"\udcff"})",
                               "null",
                               R"({"kept":2.5})"};
  for (const char* step : steps) {
    const Json::Value value = Device::ParseJson(step);
    ASSERT_TRUE(store.UpdateTask(mine, {{"data", value}}, false));
    EXPECT_EQ(mine.properties["data"].Value(), value);
    ASSERT_TRUE(store.RefreshTask(other));
    EXPECT_EQ(other.properties["data"].Value(), value) << step;
    EXPECT_EQ(store.FindTask(mine.id)->properties["data"].Value(), value) << step;
  }
  store.RemoveTask(mine.id);
  EXPECT_FALSE(store.RefreshTask(other));
  std::map<std::string, Device::TaskRow> rows = {{mine.id, mine}};
  store.RefreshTasks(rows);
  EXPECT_TRUE(rows.empty());

  // Of many tasks, what is large would take too much memory.
  Device::TaskRow failed;
  failed.id = "failed";
  Json::Value data;
  data["params"]["path"] = "/photo";
  data["errors"][0]["path"] = std::string(Device::kLargeMember, 'x');
  failed.properties["data"] = data;
  store.AddTask(failed);
  store.RefreshTasks(rows);
  const Device::StoredValue& listed = rows["failed"].Property("data");
  EXPECT_FALSE(listed.HasMember("params"));
  EXPECT_EQ(listed.Member("errors"), Json::Value());
  EXPECT_EQ(Device::TaskView(rows["failed"], {})["errors"].size(), 1U);
  EXPECT_EQ(store.FindTask("failed")->Property("data").Value(), data);
}

// The bytes in the files, not what the database shows of them.
TEST_F(StoreTest, ThePasswordOfARemovedTaskIsInNoFileOfTheStore) {
  const std::string password = "correct-horse-battery";
  const auto is_kept = [&] {
    return (ReadFile(file_) + ReadFile(file_ + "-wal")).find(password) != std::string::npos;
  };
  const auto params = [&](const std::string& source) {
    return JobParams({source}, "/photo/z.7z", R"({"format":"7z","password":")" + password + "\"}");
  };
  RunJob(params("/photo/a.txt"));
  EXPECT_FALSE(is_kept());

  sqlite3* reader = nullptr;
  ASSERT_EQ(sqlite3_open(file_.c_str(), &reader), SQLITE_OK);
  sqlite3_exec(reader, "BEGIN; SELECT * FROM tasks", nullptr, nullptr, nullptr);
  RunJob(params("/photo/a.txt"));
  EXPECT_TRUE(is_kept());
  ASSERT_EQ(sqlite3_close(reader), SQLITE_OK);
  Ask("status", "Zantro_none");
  EXPECT_FALSE(is_kept());

  fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
  const std::string task = Call("start", params("/photo/zeros")).data["taskid"].asString();
  EXPECT_TRUE(is_kept());
  kill(Worker(), SIGKILL);
  EXPECT_TRUE(Follow(task).isMember("errors"));
  EXPECT_FALSE(is_kept());

  Device::TaskStore store("alice");
  Device::TaskRow row;
  row.id = "Zantro_test";
  row.properties["data"] = Device::ParseJson(R"({"params":{"password":")" + password + "\"}}");
  store.AddTask(row);
  ASSERT_TRUE(is_kept());
  ASSERT_TRUE(store.UpdateTask(row, {{"data", Device::ParseJson(R"({"params":{}})")}}, false));
  EXPECT_FALSE(is_kept());
}

}  // namespace
