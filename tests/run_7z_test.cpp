// What the module makes of the archiver's lines, with a program in its place that prints them.
#include <fcntl.h>

#include <filesystem>

#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "tests/device_fixture.h"
#include "tests/libc_faults.h"

namespace {

using Strings = std::vector<std::string>;
using testing::ValuesIn;

class RunTest : public DeviceTest {
 protected:
  RunTest() { Add("vol1/photo/a.txt", "a"); }

  // The archiver prints this text and ends well.
  void Print(const std::string& text) {
    WriteFile(temp_.Path() + "/output", text);
    setenv("KAVO_SCRIPTED_OUTPUT", (temp_.Path() + "/output").c_str(), 1);
    const std::filesystem::path here = std::filesystem::read_symlink("/proc/self/exe");
    Device::TheDevice().archiver = Device::FileDescriptor(
        open((here.parent_path() / "scripted-7z").c_str(), O_PATH | O_CLOEXEC));
  }

  Json::Value Run(const std::string& dest = "/photo/z.zip") {
    return RunJob(JobParams({"/photo/a.txt"}, dest));
  }
};

struct ErrorRow {
  const char* name;
  const char* line;
  const char* dest;
  const char* fault;  // may be empty
  int code;
  Strings log;
};
void PrintTo(const ErrorRow& row, std::ostream* out) { *out << row.name; }

// clang-format off
const ErrorRow kErrors[] = {
    {"NoSpace", "Error: write: No space left on device", "/photo/z.zip", "", 416, {}},
    {"Quota", "7z: Error: Disk quota exceeded", "/photo/z.zip", "", 415, {}},
    {"ReadOnly", "Error: Read-only file system", "/photo/z.zip", "", 411, {}},
    {"NameTooLong", "Error: File name too long", "/photo/z.zip", "", 412, {}},
    {"NameTooLongEncrypted", "Error: File name too long", "/vault/z.zip", "", 413, {}},
    {"NameTooLongShareUnknown", "Error: File name too long", "/vault/z.zip",
     "LumoLibCheckEncryptShare=0", 412, {"Failed to get share info for /vault/z.zip"}},
    {"FirstCauseCounts", "Error: File name too long, Disk quota exceeded", "/photo/z.zip", "", 415,
     {}},
    {"Other", "Error: what", "/photo/z.zip", "", 1300, {"Error: what", ""}},
    {"CauseWithoutMark", "No space left on device\nError: x", "/photo/z.zip", "", 1300,
     {"Error: x", ""}},
};
// clang-format on

class RunFails : public RunTest, public testing::WithParamInterface<ErrorRow> {};

TEST_P(RunFails, WithTheCodeOfTheErrorLine) {
  const ErrorRow& row = GetParam();
  Print(std::string("Total: 9\n") + row.line + "\nError: No space left on device\n");
  if (row.fault[0] != 0) {
    Device::AddFault(row.fault);
  }
  EXPECT_EQ(FailJob(JobParams({"/photo/a.txt"}, row.dest)),
            Strings{std::string(row.dest) + ": " + std::to_string(row.code)});
  Strings log = row.log;
  log.push_back(std::string("Failed to compress file ") + row.dest);
  EXPECT_EQ(Log(), log);
  EXPECT_TRUE(Calls("KAVOFSAclChmod").empty());
  EXPECT_EQ(Calls("KLIBCPclose").size(), 1U);
  EXPECT_TRUE(StagedPaths().empty());
}

INSTANTIATE_TEST_SUITE_P(ErrorLines, RunFails, ValuesIn(kErrors),
                         [](const auto& row) { return row.param.name; });

struct SetUpRow {
  const char* name;
  const char* fault;
  LibcFault libc;
  const char* item;
  Strings log;
};
void PrintTo(const SetUpRow& row, std::ostream* out) { *out << row.name; }

// clang-format off
const SetUpRow kSetUps[] = {
    {"ArchivePathUnresolved", "PathInfoFactory::create#2=0:407", {}, "/photo/z.zip: 407",
     {"Failed to get path info:/photo/z.zip, reason=[197]"}},
    {"NoVolume", "VolumePathParse=-1", {}, "DEV/vol1: 1300",
     {"Failed to get volume info, DEV/vol1"}},
    {"WorkFolderNotEntered", "FindCommonParent=DEV/vol1/photo/", {"chdir", "vol1/photo", EACCES},
     "DEV/vol1/photo/: 407", {"Failed to chdir, reason=Permission denied(13)"}},
    {"NotStarted", "KLIBCPopenv=null", {}, "/photo/z.zip: 1300", {"KLIBCPopenv failed"}},
};
// clang-format on

class SetUpFails : public RunTest, public testing::WithParamInterface<SetUpRow> {
 protected:
  std::string Fill(std::string text) const {
    const std::size_t at = text.find("DEV");
    return at == std::string::npos ? text : text.replace(at, 3, device_);
  }
};

TEST_P(SetUpFails, BeforeTheArchiverRuns) {
  const SetUpRow& row = GetParam();
  Device::AddFault(Fill(row.fault));
  SetLibcFault(row.libc);
  EXPECT_EQ(FailJob(JobParams({"/photo/a.txt"}, "/photo/z.zip")), Strings{Fill(row.item)});
  EXPECT_EQ(Log(), (Strings{Fill(row.log.front()), "Failed to compress file /photo/z.zip"}));
  EXPECT_TRUE(Calls("KLIBKavoIndexAdd").empty());
  EXPECT_TRUE(Calls("KLIBCPclose").empty());
  EXPECT_TRUE(StagedPaths().empty());
}

INSTANTIATE_TEST_SUITE_P(EachStep, SetUpFails, ValuesIn(kSetUps),
                         [](const auto& row) { return row.param.name; });

TEST_F(RunTest, ArgumentsStandInTheirOrderEmptyOnesIncluded) {
  Json::Value params = JobParams({"/photo/a.txt"}, "/photo/z.7z");
  Print("");
  RunJob(params);
  params["mode"] = "synchroize";
  params["level"] = "best";
  params["format"] = "7z";
  params["password"] = "pass word";
  RunJob(params);
  params["mode"] = "synchronize";  // no keyword
  params["format"] = "7Z";
  params["level"] = "";
  params["password"] = "";
  RunJob(params);
  const std::vector<TracedCall> runs = Calls("KLIBCPopenv");
  const auto arguments = [&](std::size_t run) {
    Json::Value all = runs[run].args[2];
    std::string text;
    for (const Json::Value& each : all) {
      const std::string argument = each.asString();
      text += "|" + (argument.rfind("@/tmp/lumozip", 0) == 0 ? "@LIST" : argument);
    }
    return text;
  };
  const std::string archive = At("vol1/photo/z.7z");
  EXPECT_EQ(arguments(0),
            "|/usr/bin/7z||-utf16|" + archive + "|||-lang|-xr!@eaDir|@LIST|-progress");
  EXPECT_EQ(arguments(1), "|/usr/bin/7z|u|-utf16|" + archive +
                              "|-up1q0r2x1y2z1w2|-mx9|-ppass word|-xr!@eaDir|@LIST|-progress");
  EXPECT_EQ(arguments(2),
            "|/usr/bin/7z|a|-utf16|" + archive + "||-mx6|-lang|-xr!@eaDir|@LIST|-progress");
}

TEST_F(RunTest, ProgressLinesReachTheTask) {
  Print(
      "Progress: 7\nTotal: 5000000000\nCompressing photo/a.txt\nProgress: 42\nnoise\nProgress: 99");
  const Json::Value answer = Run();
  const std::vector<TracedCall> saved = Calls("SaveTaskData");
  ASSERT_EQ(saved.size(), 4U);
  EXPECT_EQ(saved[0].args[1]["total_size"], 0);
  EXPECT_EQ(saved[1].args[1]["total_size"].asUInt64(), 5000000000U);
  EXPECT_EQ(saved[1].args[2], 0.0);
  EXPECT_EQ(saved[1].args[1]["file"], "");
  EXPECT_EQ(saved[2].args[1]["file"], "\n");
  EXPECT_FLOAT_EQ(saved[2].args[2].asFloat(), 0.42F);
  // The last fraction stands, also when it is not 1.
  EXPECT_FLOAT_EQ(answer["progress"].asFloat(), 0.99F);
  EXPECT_FALSE(answer.isMember("errors"));
}

TEST_F(RunTest, AFileNameIsNoErrorLine) {
  Print("Compressing Error: No space left on device\nTotal: Error: 3\nProgress: 3 Error:\n");
  EXPECT_FALSE(Run().isMember("errors"));
}

TEST_F(RunTest, ACompressingLineThatIsCutOffFailsTheJobAndLeavesNothing) {
  Print("Total: 3\nCompressing ");
  EXPECT_EQ(FailJob(JobParams({"/photo/a.txt"}, "/photo/z.zip")), Strings{"/photo/z.zip: 1300"});
  EXPECT_EQ(Calls("KLIBCPclose").size(), 1U);
  EXPECT_TRUE(StagedPaths().empty());
}

TEST_F(RunTest, ProgressThatIsNotStoredIsLoggedAndNoMore) {
  Add("vol1/photo/z.zip", "an archive");
  Print("Total: 3\n");
  Device::AddFault("SaveTaskData=0");
  EXPECT_FALSE(Run().isMember("errors"));
  EXPECT_EQ(Log(), Strings{"Failed to save task data"});
}

TEST_F(RunTest, ModeAndOwnerThatAreNotSetAreLoggedAndNoMore) {
  const std::string archive = Add("vol1/photo/z.zip", "an archive");
  Print("");
  Device::AddFault("KAVOFSAclChmod=-1");
  Device::AddFault("LumoLibChown2Admin=-1");
  EXPECT_FALSE(Run().isMember("errors"));
  ASSERT_EQ(Log().size(), 2U);
  EXPECT_EQ(Log()[0].rfind("failed to ACL chmod '" + archive + "' to 777, errno: ", 0), 0U);
  EXPECT_EQ(Log()[1], "LumoLibChown2Admin fail");
  EXPECT_EQ(Calls("KAVOFSAclChmod").back().args[2], 0666);
  EXPECT_EQ(Calls("KLIBKavoIndexAdd").back().args[0], archive);

  Device::AddFault("KLIBGroupIsAdminGroupMem=-1");
  RunJob(JobParams({"/photo/a.txt"}, "/photo/z.zip"), "bob");
  EXPECT_EQ(Log().back().rfind("KLIBGroupIsAdminGroupMem(bob) failed. [0x0000 :0]", 0), 0U);
  EXPECT_EQ(Calls("LumoLibChown2Admin").size(), 1U);
}

TEST_F(RunTest, WithoutASavedMaskTheProcessesMaskCounts) {
  Print("");
  Device::AddFault("LumoLibUmask=-1");
  Device::AddFault("LumoLibGetUmask=027");
  Run();
  EXPECT_EQ(Calls("KAVOFSAclChmod").back().args[2], 0640);
}

}  // namespace
