// Every way in which a job fails: items, log lines, and every call between the one that fails and
// the storing of the outcome. The way of a job that succeeds stands in tests/sequences.
#include <gmock/gmock.h>

#include <csignal>
#include <filesystem>

#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "tests/device_fixture.h"
#include "tests/libc_calls.h"

namespace {

using testing::ElementsAreArray;
using testing::ValuesIn;

struct FailureRow {
  const char* name;
  std::string fault;  // of an operation; "DEV" stands for the device's folder; empty: none
  LibcFault libc;
  std::string last;   // the last call that is as in a job that succeeds
  std::string after;  // those from there to the worker's own log line
  Strings items;
  Strings log;
  std::string dest = "/photo/out.zip";
  Strings sources = {"/photo/trip/a.txt", "/photo/trip/day"};
  const char* user = "alice";
};
void PrintTo(const FailureRow& row, std::ostream* out) { *out << row.name; }

const std::string kPathFailed = "Failed to generate path info";
const std::string kDestFailed = "Extract destination privilege not enough";
const std::string kSourceFailed = "Can't access source files";
const std::string kListFailed = "Failed to get ziplist";
const std::string kRunFailed = "Failed to compress file /photo/out.zip";
const std::string kLogged =
    "LumoLibGetErr syslog LumoLibGetErr";  // once for the line, once for the item
const std::string kSession = " KAVO::APIRequest::GetSessionID CheckShareListPrivilege ";
const std::string kUnstage = " stat KLIBCExecl";
const std::string kName144(144, 'n');
const Strings kTwoShares = {"/photo/trip/a.txt", "/music", "/photo/trip/day/b.txt"};
const std::string kHome = "/home/z.7z";

// clang-format off
const FailureRow kRows[] = {
    // Who and what.
    {"Identity", "LumoLibUGIDSet#2=-1:402", {}, "LumoLibUGIDSet", "syslog LumoLibGetErr",
     {"/photo/out.zip: 402"}, {"Failed to set UGID for user=alice, sid=SID"}},
    {"SecondSourceUnresolved", "PathInfoFactory::create#2=0:407", {}, "PathInfoFactory::create#2",
     kLogged + " syslog", {"/photo/trip/day: 407"},
     {"Failed to get path info:/photo/trip/day, reason=[197]", kPathFailed}},
    {"UnknownShare", "", {}, "PathInfoFactory::create#2", kLogged + " syslog", {"/nowhere/a: 408"},
     {"Failed to get path info:/nowhere/a, reason=[198]", kPathFailed}, "/photo/out.zip",
     {"/photo/trip/a.txt", "/nowhere/a", "/photo/trip/day"}},
    {"LeadsOutOfShare", "", {}, "PathInfoFactory::create", kLogged + " syslog",
     {"/photo/../music/m.txt: 419"},
     {"Failed to get path info:/photo/../music/m.txt, reason=[1A3]", kPathFailed}, "/photo/out.zip",
     {"/photo/../music/m.txt"}},
    // The destination.
    {"DestUnresolved", "LumoFullPathGet=0:408", {}, "LumoFullPathGet", kLogged + " syslog",
     {"/photo/out.zip: 408"}, {"Failed to get path info: /photo/out.zip, err=408", kDestFailed}},
    {"DestPrivilegeUnknown", "LumoLibGetPrivilege=-1:402", {}, "LumoLibGetPrivilege",
     kLogged + " syslog", {"/photo/out.zip: 402"},
     {"compress dest no privilege, reason[402]", kDestFailed}},
    {"DestReadOnlyForUser", "", {}, "LumoLibGetPrivilege", "syslog", {"/music/out.zip: 407"},
     {kDestFailed}, "/music/out.zip", {"/photo/trip/a.txt", "/photo/trip/day"}, "bob"},
    {"DestShareSuspended", "", {}, "LumoLibGetPrivilege", "syslog", {"/attic/out.zip: 407"},
     {kDestFailed}, "/attic/out.zip"},
    {"DestLevelZero", "LumoLibGetPrivilege=0", {}, "LumoLibGetPrivilege", "syslog",
     {"/photo/out.zip: 407"}, {kDestFailed}},
    {"DestPathRefused", "LumoCheckPath=1:419", {}, "LumoCheckPath", kLogged + " syslog",
     {"DEV/vol1/photo: 419"}, {"invalid path DEV/vol1/photo, err=419", kDestFailed}},
    {"DestFolderNotWritable", "ACLAccess=1:407", {}, "ACLAccess", kLogged + " syslog",
     {"DEV/vol1/photo: 407"}, {"Can't access DEV/vol1/photo, err=407 ", kDestFailed}},
    {"DestFolderMissing", "", {}, "ACLAccess", kLogged + " syslog", {"DEV/vol1/photo/no: 408"},
     {"Can't access DEV/vol1/photo/no, err=408 ", kDestFailed}, "/photo/no/out.zip"},
    {"DestNameRefused", "LumoCheckFileName=-1:418", {}, "LumoCheckFileName", kLogged + " syslog",
     {"/photo/out.zip: 418"},
     {"Failed to check filename: path=DEV/vol1/photo file name = out.zip reason=[418] ",
      kDestFailed}},
    {"DestNameTooLongForEncryptedShare", "", {}, "LumoCheckFileName", kLogged + " syslog",
     {"/vault/" + kName144 + ": 413"},
     {"Failed to check filename: path=DEV/vol2/vault file name = " + kName144 + " reason=[413] ",
      kDestFailed}, "/vault/" + kName144},
    // The sources: each is examined whatever the others gave.
    {"FirstSourcePathRefused", "LumoCheckPath#2=1:419", {}, "LumoCheckPath#2",
     "LumoLibGetErr LumoCheckPath" + kSession + "stat ACLAccess syslog",
     {"/photo/trip/a.txt: 419"}, {kSourceFailed}},
    {"RefusedWithoutCode", "LumoCheckPath#2=1:0", {}, "LumoCheckPath#2",
     "LumoLibGetErr LumoCheckPath" + kSession + "stat ACLAccess syslog", {}, {kSourceFailed}},
    {"LinkLeadsOffTheVolumes", "", {}, "LumoCheckPath#2",
     "LumoLibGetErr LumoCheckPath LumoLibGetErr syslog",
     {"/photo/host/passwd: 419", "/photo/host/passwd: 419"}, {kSourceFailed}, "/photo/out.zip",
     {"/photo/host/passwd", "/photo/host/passwd"}},
    {"SourceVanishes", "", {"stat", "trip/a.txt", EIO}, "stat",
     "LumoParseErrnoToError LumoCheckPath stat ACLAccess syslog", {"/photo/trip/a.txt: 401"},
     {kSourceFailed}},
    {"VanishesWithoutCode", "LumoParseErrnoToError=0", {"stat", "trip/a.txt", EIO}, "stat",
     "LumoParseErrnoToError LumoCheckPath stat ACLAccess syslog", {}, {kSourceFailed}},
    {"SourceNotReadable", "ACLAccess#2=1:407", {}, "ACLAccess#2",
     "LumoLibGetErr LumoCheckPath stat ACLAccess syslog", {"/photo/trip/a.txt: 407"},
     {kSourceFailed}},
    {"AccessRefusedWithoutCode", "ACLAccess#3=1:0", {}, "ACLAccess#3", "LumoLibGetErr syslog", {},
     {kSourceFailed}},
    {"UnlistableShareBesideAMissingFile", "CheckShareListPrivilege=0", {}, "CheckShareListPrivilege",
     "syslog LumoCheckPath stat LumoParseErrnoToError syslog",
     {"/photo/trip/a.txt: 407", "/photo/trip/no: 408"},
     {"No share privilege to list path /photo/trip/a.txt", kSourceFailed}, "/photo/out.zip",
     {"/photo/trip/a.txt", "/photo/trip/no"}},
    // The list.
    {"NoListFile", "", {"mkstemp", "/tmp/lumozip", EACCES}, "mkstemp", "syslog unlink syslog",
     {": 1300"}, {"Failed to mkstemp /tmp/lumozip*", kListFailed}},
    {"ListFileWrittenShort", "", {"write", "day", 0}, "write#2", "syslog close unlink syslog",
     {": 1300"}, {"Failed to write ./day", " to tempzip", kListFailed}},
    {"NameWithLineFeed", "", {}, "mkstemp", "syslog close unlink syslog",
     {"/photo/two\nlines: 1300"},
     {"Name is too long for tempzip or holds a line feed: /photo/two", "lines", kListFailed},
     "/photo/out.zip", {"/photo/two\nlines", "/photo/trip"}},
    {"NoStagingFolder", "", {"mkdtemp", "/tmp/lumozip", EACCES}, "mkdtemp", "syslog syslog",
     {": 1300"}, {"Failed to create a temp directory.", kListFailed}, kHome, kTwoShares},
    {"StagingFolderNotEntered", "", {"chdir", "/tmp/lumozip", EACCES}, "chdir",
     "syslog" + kUnstage + " syslog", {": 1300"}, {"Failed to chdir /tmp/lumozip*.", kListFailed},
     kHome, kTwoShares},
    {"NoListFileInStagingFolder", "", {"mkstemp", "lumozip", ENOSPC}, "mkstemp",
     "syslog" + kUnstage + " syslog", {": 1300"}, {"Failed to create a temp file.", kListFailed},
     kHome, kTwoShares},
    {"ShareNotLinked", "", {"symlink", "music", ENOSPC}, "symlink#2",
     "syslog LumoParseErrnoToError close" + kUnstage + " syslog", {"DEV/vol1/music: 416"},
     {"Failed to link the file from DEV/vol1/music to music.", kListFailed}, kHome, kTwoShares},
    {"StagedListWrittenShort", "", {"write", "./music", 0}, "write#2",
     "syslog close" + kUnstage + " syslog", {": 1300"}, {"Failed to write tempzip", kListFailed},
     kHome, kTwoShares},
    {"StagedNameWithLineFeed", "", {}, "symlink", "syslog close" + kUnstage + " syslog",
     {"/photo/two\nlines: 1300"},
     {"Name is too long for tempzip or holds a line feed: /photo/two", "lines", kListFailed}, kHome,
     {"/photo/two\nlines", "/music", "/photo/trip/a.txt"}},
    {"ParentLongerThanSource", "FindCommonParent=" + std::string(4000, 'p'), {}, "mkstemp",
     "close syslog", {"/photo/out.zip: 1300"},
     {"Unexpected failure: basic_string::substr: __pos (which is 3999) > this->size() (which is *"}},
    // Before the archiver runs.
    {"ArchivePathUnresolved", "PathInfoFactory::create#3=0:407", {}, "PathInfoFactory::create#3",
     kLogged + " access unlink syslog", {"/photo/out.zip: 407"},
     {"Failed to get path info:/photo/out.zip, reason=[197]", kRunFailed}},
    {"NoVolume", "VolumePathParse=-1", {}, "VolumePathParse", "syslog access unlink syslog",
     {"DEV/vol1: 1300"}, {"Failed to get volume info, DEV/vol1", kRunFailed}},
    {"WorkFolderNotEntered", "", {"chdir", "vol1/photo", EACCES}, "chdir",
     "syslog LumoParseErrnoToError access unlink syslog", {"DEV/vol1/photo/trip/: 407"},
     {"Failed to chdir, reason=Permission denied(13)", kRunFailed}},
    {"ArchiverNotStarted", "KLIBCPopenv=null", {}, "KLIBCPopenv", "syslog access unlink syslog",
     {"/photo/out.zip: 1300"}, {"KLIBCPopenv failed", kRunFailed}},
};
// clang-format on

class JobFails : public DeviceTest, public testing::WithParamInterface<FailureRow> {};

TEST_P(JobFails, WithItsItemsAndLinesAndNoFurtherCall) {
  const FailureRow& row = GetParam();
  for (const char* name : {"trip/a.txt", "trip/day/b.txt", "two\nlines"}) {
    Add(std::string("vol1/photo/") + name, "text");
  }
  ASSERT_EQ(::symlink("/etc", At("vol1/photo/host").c_str()), 0);
  if (!row.fault.empty()) {
    Device::AddFault(row.fault);
  }
  SetLibcFault(row.libc);
  Json::Value params = JobParams(row.sources, row.dest);
  for (const char* name : {"mode", "level", "password"}) {
    params[name] = "x";
  }
  Strings items = FailJob(params, row.user);
  for (std::string& item : items) {
    item = Plain(item);
  }
  EXPECT_EQ(items, row.items);
  Strings log = Log();
  for (std::string& line : log) {
    const std::size_t length = line.rfind("(which is ");
    line = length == std::string::npos ? line : line.substr(0, length) + "(which is *";
  }
  EXPECT_EQ(log, row.log);

  const bool is_staged = row.sources.size() == 3 && row.dest == kHome;
  const Strings job =
      NamesOf(ExpectedSequence(is_staged ? "job_of_two_shares" : "job_of_one_share"));
  const Strings end = Behind(NamesOf(ExpectedSequence("failed_job")), "syslog");
  EXPECT_EQ(Sequence(Fork().result.asInt()), UpTo(job, row.last) + Words(row.after) + end);
  for (const std::string& path : StagedPaths()) {
    EXPECT_STREQ(row.name, "ParentLongerThanSource") << path;
  }
}

INSTANTIATE_TEST_SUITE_P(EachStep, JobFails, ValuesIn(kRows),
                         [](const auto& row) { return row.param.name; });

class WorkerTest : public DeviceTest {
 protected:
  WorkerTest() { Add("vol1/photo/a.txt", "a"); }
  Json::Value LastData() const { return Calls("Vesk::Task::setProperty").back().args[1]; }
};

TEST_F(WorkerTest, NotifiesOfAFailureWithTwoArguments) {
  Device::AddFault("Vesk::Task::getBoolProperty=1");
  Device::AddFault("LumoLibGetPrivilege=-1:402");
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
  EXPECT_EQ(Sequence(Fork().result.asInt()),
            Words("KLIBCProcFork signal WaitForTaskDataReady") + end);
  RunJob(JobParams({"/photo/z.zip", "/photo/z.zip"}, "/photo/z.zip"));
  EXPECT_EQ(LastData()["errors"].size(), 2U);
}

TEST_F(WorkerTest, DoesNotFinishATaskItCannotRead) {
  Device::AddFault("Vesk::Task::getProperty=null");
  Call("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  ASSERT_TRUE(WaitUntil([&] { return !Calls("_exit").empty(); }));
  EXPECT_EQ(Log().front(), "Failed to get task data");
  EXPECT_EQ(Log().back(), "Failed to get json data");
  EXPECT_EQ(Behind(Sequence(Fork().result.asInt()), "Vesk::Task::getProperty"),
            Words("syslog KAVO::APIRequest::GetLoginUserName CleanTimeOutTasks _exit"));
  EXPECT_TRUE(Calls("SaveTaskData").empty());
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

TEST_F(WorkerTest, TakesARequestValueThatIsNoTextForAFailure) {
  for (const char* param : {"level", "mode", "format", "password"}) {
    Json::Value params = JobParams({"/photo/a.txt"}, "/photo/z.zip");
    params[param] = Json::Value(Json::objectValue);
    EXPECT_EQ(FailJob(params), Strings{"/photo/z.zip: 1300"}) << param;
  }
  EXPECT_TRUE(Calls("KLIBCPopenv").empty());
  EXPECT_TRUE(StagedPaths().empty());
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
  EXPECT_EQ(LastData().isMember("errors"), false);
}

TEST_F(WorkerTest, ThePrivilegeOfTheDestinationIsLevelTwoWithoutTheFlag) {
  ScriptArchiver("");
  Add("vol1/photo/z.zip", "an archive");
  const struct {
    const char* outputs;
    bool suffices;
  } rows[] = {{R"("level":2)", true},
              {R"("level":2,"flags":1)", true},
              {R"("level":2,"flags":2)", false},
              {R"("level":2,"flags":3)", false},
              {R"("level":2,"flags":6)", false},
              {R"("level":1)", false},
              {R"("level":3)", false}};
  for (const auto& row : rows) {
    Watch();
    Device::AddFault(std::string(R"(LumoLibGetPrivilege={"result":0,)") + row.outputs + "}");
    const Json::Value answer = RunJob(JobParams({"/photo/a.txt"}, "/photo/z.zip"));
    EXPECT_EQ(!answer.isMember("errors"), row.suffices) << row.outputs;
    EXPECT_EQ(Log(), row.suffices ? Strings{} : Strings{kDestFailed});
  }
}

TEST_F(WorkerTest, NamesAndPathsOverTheSystemsLimit) {
  const std::string name = "/photo/" + std::string(256, 'n');
  EXPECT_EQ(FailJob(JobParams({name}, "/photo/z.zip")), Strings{name + ": 412"});
  const std::string path = "/photo/" + std::string(1 << 20U, 'p');
  EXPECT_EQ(FailJob(JobParams({path}, "/photo/z.zip")), Strings{path + ": 412"});
}

// Resolved paths that no file system holds; an unlisted share is not looked into.
class LongPathTest : public WorkerTest {
 protected:
  LongPathTest() {
    ScriptArchiver("");
    Device::AddFault("CheckShareListPrivilege=0");
    Device::AddFault("LumoCheckPath=0");
  }
  static void Resolve(int call, const std::string& field, const std::string& path) {
    Json::Value outputs;
    outputs["result"] = 1;
    outputs["share_name"] = "share" + std::to_string(call);
    outputs["share_real_path"] = "/";
    outputs[field] = path;
    Device::AddFault("PathInfoFactory::create#" + std::to_string(call) + "=" +
                     Device::ToText(outputs));
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
      Watch();
      for (const char* rule : {"CheckShareListPrivilege=0", "LumoCheckPath=0", "VolumePathParse=0",
                               "FindCommonParent=/"}) {
        Device::AddFault(rule);
      }
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
  for (const char* rule : {"VolumePathParse=0", "ACLAccess=0", "LumoCheckFileName=0"}) {
    Device::AddFault(rule);
  }
  Device::AddFault(R"(LumoFullPathGet={"result":1,"full_path":")" + path + "\"}");
  Resolve(2, "real_path", path);
  RunJob(JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  // A name ends with the 4095th byte of its path, the archive's path with its 4094th.
  EXPECT_EQ(Calls("LumoCheckFileName").front().args[1].asString().size(), 4095U - 4002U);
  EXPECT_EQ(Calls("KLIBCPopenv").front().args[2][3], path.substr(0, 4094));
}

}  // namespace
