// Every way in which a job fails before the archiver runs: items, log lines, and what is not asked
// any more.
#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "tests/device_fixture.h"
#include "tests/emulation.h"
#include "tests/libc_faults.h"

namespace {

using Strings = std::vector<std::string>;
using testing::ValuesIn;

// "DEV" in the texts stands for the device's folder.
struct FailureRow {
  const char* name;
  Strings faults;
  LibcFault libc;
  Strings items;
  Strings log;  // the lines before the steps' last, which is the worker's own
  std::string worker_log;
  const char* not_called = "";
  Strings sources = {"/photo/a.txt", "/photo/b.txt"};
  std::string dest = "/photo/out.zip";
  const char* user = "alice";
};
void PrintTo(const FailureRow& row, std::ostream* out) { *out << row.name; }

const std::string kPathFailed = "Failed to generate path info";
const std::string kDestFailed = "Extract destination privilege not enough";
const std::string kSourceFailed = "Can't access source files";
const std::string kListFailed = "Failed to get ziplist";
const Strings kTwoShares = {"/photo/a.txt", "/music/m.txt"};

// clang-format off
const FailureRow kRows[] = {
    {"Identity", {"LumoLibUGIDSet#2=-1:402"}, {}, {"/photo/out.zip: 402"}, {},
     "Failed to set UGID for user=alice, sid=SID", "PathInfoFactory::create"},
    {"SecondSourceDoesNotResolve", {"PathInfoFactory::create#2=0:407"}, {}, {"/photo/b.txt: 407"},
     {"Failed to get path info:/photo/b.txt, reason=[197]"}, kPathFailed, "LumoFullPathGet",
     {"/photo/a.txt", "/photo/b.txt", "/photo/c.txt"}},
    {"UnknownShare", {}, {}, {"/nowhere/a: 408"},
     {"Failed to get path info:/nowhere/a, reason=[198]"}, kPathFailed, "LumoFullPathGet",
     {"/nowhere/a"}},
    {"LeadsOutOfShare", {}, {}, {"/photo/../music/m.txt: 419"},
     {"Failed to get path info:/photo/../music/m.txt, reason=[1A3]"}, kPathFailed,
     "LumoFullPathGet", {"/photo/../music/m.txt"}},
    {"DestUnresolved", {"LumoFullPathGet=0:408"}, {}, {"/photo/out.zip: 408"},
     {"Failed to get path info: /photo/out.zip, err=408"}, kDestFailed, "IsDirUserHome"},
    {"DestPrivilegeUnknown", {"LumoLibGetPrivilege=-1:402"}, {}, {"/photo/out.zip: 402"},
     {"compress dest no privilege, reason[402]"}, kDestFailed, "LumoCheckPath"},
    {"DestReadOnlyForUser", {}, {}, {"/music/out.zip: 407"}, {}, kDestFailed, "LumoCheckPath",
     {"/photo/a.txt"}, "/music/out.zip", "bob"},
    {"DestShareSuspended", {}, {}, {"/attic/out.zip: 407"}, {}, kDestFailed, "LumoCheckPath",
     {"/photo/a.txt"}, "/attic/out.zip"},
    {"DestLevelTooHigh", {"LumoLibGetPrivilege=0"}, {}, {"/photo/out.zip: 407"}, {}, kDestFailed,
     "LumoCheckPath"},
    {"DestPathRefused", {"LumoCheckPath=-1:419"}, {}, {"DEV/vol1/photo: 419"},
     {"invalid path DEV/vol1/photo, err=419"}, kDestFailed, "ACLAccess"},
    {"DestFolderNotWritable", {"ACLAccess=-1:407"}, {}, {"DEV/vol1/photo: 407"},
     {"Can't access DEV/vol1/photo, err=407 "}, kDestFailed, "LumoCheckFileName"},
    {"DestFolderMissing", {}, {}, {"DEV/vol1/photo/no: 408"},
     {"Can't access DEV/vol1/photo/no, err=408 "}, kDestFailed, "LumoCheckFileName",
     {"/photo/a.txt"}, "/photo/no/out.zip"},
    {"DestNameRefused", {"LumoCheckFileName=-1:418"}, {}, {"/photo/out.zip: 418"},
     {"Failed to check filename: path=DEV/vol1/photo file name = out.zip reason=[418] "},
     kDestFailed, "CheckShareListPrivilege"},
    {"DestNameTooLongForEncryptedShare", {}, {}, {"/vault/" + std::string(144, 'n') + ": 413"},
     {"Failed to check filename: path=DEV/vol2/vault file name = " + std::string(144, 'n') +
      " reason=[413] "},
     kDestFailed, "CheckShareListPrivilege", {"/photo/a.txt"}, "/vault/" + std::string(144, 'n')},
    {"EverySourceIsExamined", {"LumoCheckPath#2=-1:419", "ACLAccess#2=-1:407"}, {},
     {"/photo/a.txt: 419", "/photo/b.txt: 407", "/photo/no.txt: 408"}, {}, kSourceFailed,
     "FindCommonParent", {"/photo/a.txt", "/photo/b.txt", "/photo/no.txt"}},
    {"RefusalsWithoutCode", {"LumoCheckPath#2=-1:0", "ACLAccess#2=-1:0"}, {}, {}, {}, kSourceFailed,
     "FindCommonParent"},
    {"LinkLeadsOffTheVolumes", {}, {}, {"/photo/host/passwd: 419"}, {}, kSourceFailed,
     "FindCommonParent", {"/photo/host/passwd"}},
    {"UnlistableShareIsReportedBesideOthers", {"CheckShareListPrivilege=0"}, {},
     {"/photo/a.txt: 407", "/photo/no.txt: 408"}, {"No share privilege to list path /photo/a.txt"},
     kSourceFailed, "FindCommonParent", {"/photo/a.txt", "/photo/no.txt"}},
    {"NoListFile", {}, {"mkstemp", "/tmp/lumozip", EACCES}, {": 1300"},
     {"Failed to mkstemp /tmp/lumozipXXXXXX"}, kListFailed, "VolumePathParse"},
    {"ListFileWrittenShort", {}, {"write", "lumozip", 0}, {": 1300"},
     {"Failed to write ./a.txt", " to tempzip"}, kListFailed, "VolumePathParse"},
    {"NoStagingFolder", {}, {"mkdtemp", "/tmp/lumozip", EACCES}, {": 1300"},
     {"Failed to create a temp directory."}, kListFailed, "KLIBCExecl", kTwoShares},
    {"StagingFolderNotEntered", {}, {"chdir", "/tmp/lumozip", EACCES}, {": 1300"},
     {"Failed to chdir STAGED."}, kListFailed, "VolumePathParse", kTwoShares},
    {"NoListFileInStagingFolder", {}, {"mkstemp", "lumozip", ENOSPC}, {": 1300"},
     {"Failed to create a temp file."}, kListFailed, "VolumePathParse", kTwoShares},
    {"ShareNotLinked", {}, {"symlink", "music", ENOSPC}, {"DEV/vol1/music: 416"},
     {"Failed to link the file from DEV/vol1/music to music."}, kListFailed, "VolumePathParse",
     kTwoShares},
    {"StagedListWrittenShort", {}, {"write", "lumozip", 0}, {": 1300"}, {"Failed to write tempzip"},
     kListFailed, "VolumePathParse", kTwoShares},
    {"NameWithLineFeed", {"CheckShareListPrivilege=1"}, {}, {"/photo/two\nlines: 1300"},
     {"Name is too long for tempzip or holds a line feed: /photo/two", "lines"}, kListFailed,
     "VolumePathParse", {"/photo/two\nlines"}},
    {"StagedNameWithLineFeed", {}, {}, {"/photo/two\nlines: 1300"},
     {"Name is too long for tempzip or holds a line feed: /photo/two", "lines"}, kListFailed,
     "VolumePathParse", {"/photo/two\nlines", "/music/m.txt"}},
    {"ParentLongerThanSource",
     {"FindCommonParent=/a/folder/that/is/much/longer/than/any/of/the/sources/of/"
      "this/job/can/be/in/the/folder/of/a/test/"},
     {}, {"/photo/out.zip: 1300"}, {}, "Unexpected failure: basic_string::substr",
     "VolumePathParse"},
};
// clang-format on

class JobFails : public DeviceTest, public testing::WithParamInterface<FailureRow> {
 protected:
  std::string Fill(std::string text) const {
    const auto replace = [&](const std::string& mark, const std::string& by) {
      const std::size_t at = text.find(mark);
      text = at == std::string::npos ? text : text.replace(at, mark.size(), by);
    };
    replace("DEV", device_);
    for (const TracedCall& call : Calls("KAVO::APIRequest::GetSessionID")) {
      replace("SID", call.result.asString());
    }
    for (const TracedCall& call : Calls("KLIBCExecl")) {
      replace("STAGED", call.args[2][1].asString());
    }
    return text;
  }
};

TEST_P(JobFails, WithItsItemsAndLines) {
  const FailureRow& row = GetParam();
  for (const char* name : {"photo/a.txt", "photo/b.txt", "music/m.txt", "photo/two\nlines"}) {
    Add(std::string("vol1/") + name, "text");
  }
  ASSERT_EQ(symlink("/etc", At("vol1/photo/host").c_str()), 0);
  for (const std::string& rule : row.faults) {
    Device::AddFault(rule);
  }
  SetLibcFault(row.libc);
  const Strings items = FailJob(JobParams(row.sources, row.dest), row.user);
  SetLibcFault({});

  Strings expected_items;
  for (const std::string& item : row.items) {
    expected_items.push_back(Fill(item));
  }
  EXPECT_EQ(items, expected_items);
  Strings expected_log;
  for (const std::string& line : row.log) {
    expected_log.push_back(Fill(line));
  }
  Strings log = Log();
  ASSERT_FALSE(log.empty());
  EXPECT_EQ(log.back().rfind(Fill(row.worker_log), 0), 0U) << log.back();
  log.pop_back();
  EXPECT_EQ(log, expected_log);
  EXPECT_TRUE(Calls(row.not_called).empty());
  EXPECT_TRUE(Calls("KLIBCPopenv").empty());
  if (row.worker_log != "Unexpected failure: basic_string::substr") {
    EXPECT_TRUE(StagedPaths().empty());
  }
}

INSTANTIATE_TEST_SUITE_P(EachStep, JobFails, ValuesIn(kRows),
                         [](const auto& row) { return row.param.name; });

class WorkerTest : public DeviceTest {};

// Data is stored and the task finished whatever happened; the notification, or its keys, tell
// which.
TEST_F(WorkerTest, TellsTheOutcomeByNotificationOrInTheTask) {
  Add("vol1/photo/a.txt", "a");
  const Json::Value works = JobParams({"/photo/a.txt"}, "/photo/<b>.zip");
  const Json::Value fails = JobParams({"/photo/no.txt"}, "/photo/<b>.zip");
  const auto last_data = [&] { return Calls("Vesk::Task::setProperty").back().args[1]; };
  RunJob(works);
  EXPECT_EQ(last_data()["notification_arg1"], "filebrowser:filebrowser_compress_completed");
  EXPECT_EQ(last_data()["notification_arg2"], "/photo/&lt;b&gt;.zip");
  EXPECT_FALSE(last_data().isMember("notification_arg3"));
  RunJob(fails);
  EXPECT_EQ(last_data()["notification_arg1"], "filebrowser:filebrowser_compress_failed");
  EXPECT_TRUE(last_data()["notification_arg3"].isString());
  EXPECT_TRUE(Calls("Vesk::Task::sendNotifyMessageNoEncode").empty());

  Device::AddFault("Vesk::Task::getBoolProperty=1");
  RunJob(works);
  RunJob(fails);
  const std::vector<TracedCall> sent = Calls("Vesk::Task::sendNotifyMessageNoEncode");
  ASSERT_EQ(sent.size(), 2U);
  EXPECT_EQ(sent[0].args[0], "KAVO.Nolo.App.Zantro3.Instance");
  EXPECT_EQ(sent[0].args[2], "tree:leaf_filebrowser");
  EXPECT_EQ(sent[0].args[3], "filebrowser:filebrowser_compress_completed");
  EXPECT_EQ(sent[0].args[4], Device::ParseJson(R"(["/photo/&lt;b&gt;.zip"])"));
  EXPECT_EQ(sent[1].args[3], "filebrowser:filebrowser_compress_failed");
  EXPECT_EQ(sent[1].args[4].size(), 2U);
  EXPECT_FALSE(last_data().isMember("notification_arg1"));
  EXPECT_TRUE(last_data().isMember("errors"));
}

TEST_F(WorkerTest, TakesAnArchiveOfItselfForDone) {
  const Json::Value answer = RunJob(JobParams({"/photo/z.zip"}, "/photo/z.zip/"));
  EXPECT_FALSE(answer.isMember("errors"));
  EXPECT_EQ(Calls("LumoLibUGIDSet").front().args[0], Json::Value());
  EXPECT_TRUE(Calls("PathInfoFactory::create").empty());
  EXPECT_EQ(Calls("CleanTimeOutTasks").size(), 1U);
}

TEST_F(WorkerTest, DoesNotFinishATaskItCannotRead) {
  Add("vol1/photo/a.txt", "a");
  Device::AddFault("SaveTaskData=1");
  Device::AddFault("Vesk::Task::getProperty=null");
  const Device::Outcome started = Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  ASSERT_TRUE(WaitUntil([&] { return !Calls("CleanTimeOutTasks").empty(); }));
  EXPECT_EQ(Log().back(), "Failed to get json data");
  EXPECT_TRUE(Calls("Vesk::Task::finish").empty());
}

TEST_F(WorkerTest, LogsATaskThatIsNotStoredAsFinished) {
  Add("vol1/photo/a.txt", "a");
  Device::AddFault("Vesk::Task::finish=0");
  Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  ASSERT_TRUE(WaitUntil([&] { return !Calls("CleanTimeOutTasks").empty(); }));
  EXPECT_EQ(Log(), Strings{"Failed to write progress."});
}

TEST_F(WorkerTest, TakesARequestValueThatIsNoTextForAFailure) {
  Add("vol1/photo/a.txt", "a");
  for (const char* param : {"level", "mode", "format", "password"}) {
    Json::Value params = JobParams({"/photo/a.txt"}, "/photo/z.zip");
    params[param] = Json::Value(Json::objectValue);
    EXPECT_EQ(FailJob(params), Strings{"/photo/z.zip: 1300"}) << param;
  }
  EXPECT_TRUE(Calls("KLIBCPopenv").empty());
  EXPECT_TRUE(StagedPaths().empty());
}

TEST_F(WorkerTest, AsksOncePerShareAndPassesOverSourcesOfOneThatIsNotListed) {
  for (const char* name : {"vol1/photo/a.txt", "vol1/photo/b.txt", "vol1/music/m.txt"}) {
    Add(name, "text");
  }
  Device::AddFault("CheckShareListPrivilege=0");
  const Json::Value answer =
      RunJob(JobParams({"/photo/a.txt", "/music/m.txt", "/photo/b.txt"}, "/photo/z.zip"));
  EXPECT_FALSE(answer.isMember("errors"));
  EXPECT_EQ(Calls("CheckShareListPrivilege").size(), 2U);
  // The destination's folder, and the second source of the share that was asked about already.
  const std::vector<TracedCall> access = Calls("ACLAccess");
  ASSERT_EQ(access.size(), 2U);
  EXPECT_EQ(access[0].args[1], 2);
  EXPECT_EQ(access[1].args[0], At("vol1/photo/b.txt"));
  EXPECT_EQ(access[1].args[1], 1);
}

TEST_F(WorkerTest, NamesAndPathsThatAreTooLong) {
  const std::string name = "/photo/" + std::string(256, 'n');
  EXPECT_EQ(FailJob(JobParams({name}, "/photo/z.zip")), Strings{name + ": 412"});
  const std::string path = "/photo/" + std::string(1 << 20U, 'p');
  EXPECT_EQ(FailJob(JobParams({path}, "/photo/z.zip")), Strings{path + ": 412"});
}

TEST_F(WorkerTest, RefusesASourceWhoseLineDoesNotFit) {
  for (const char* rule : {"LumoCheckPath=0", "CheckShareListPrivilege=0", "FindCommonParent=/"}) {
    Device::AddFault(rule);
  }
  const std::string share = At("vol1/photo/");
  const std::string fits = "/photo/" + std::string(4094 - share.size(), 'd');
  // An emulator shows the archiver the root of its own sysroot, where there is no such path.
  EXPECT_EQ(FailJob(JobParams({fits}, "/photo/z.zip")).back(),
            kIsEmulated ? "/photo/z.zip: 1300" : "/photo/z.zip: 412");
  EXPECT_FALSE(Calls("KLIBCPopenv").empty());
  const std::string too_long = fits + "d";
  EXPECT_EQ(FailJob(JobParams({too_long}, "/photo/z.zip")).back(), too_long + ": 1300");
  EXPECT_EQ(Calls("KLIBCPopenv").size(), 1U);
  EXPECT_TRUE(StagedPaths().empty());
}

TEST_F(WorkerTest, AsksNoPrivilegeForTheUsersHome) {
  Add("vol1/photo/sub/a.txt", "a");
  EXPECT_FALSE(RunJob(JobParams({"/photo/sub"}, "/home/z.zip")).isMember("errors"));
  EXPECT_TRUE(Calls("LumoLibGetPrivilege").empty());
  EXPECT_EQ(Calls("ACLAccess").back().args[1], 5);
  EXPECT_TRUE(StagedPaths().empty());
}

}  // namespace
