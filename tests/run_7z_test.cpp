// What the module makes of the archiver's lines, with a program in its place that prints them.
#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "tests/device_fixture.h"
#include "tests/libc_calls.h"

namespace {

using testing::ValuesIn;

class RunTest : public DeviceTest {
 protected:
  RunTest() { Add("vol1/photo/a.txt", "a"); }

  Json::Value Run(const std::string& dest = "/photo/z.zip") {
    return RunJob(JobParams({"/photo/a.txt"}, dest));
  }
};

struct ErrorRow {
  const char* name;
  const char* line;
  int code;
  const char* after = "";  // the calls up to the closing of the archiver's output
  Strings log = {};
  std::string dest = "/photo/z.zip";
  const char* fault = nullptr;
};
void PrintTo(const ErrorRow& row, std::ostream* out) { *out << row.name; }

// clang-format off
const ErrorRow kErrors[] = {
    {"NoSpace", "Error: write: No space left on device", 416},
    {"Quota", "7z: Error: Disk quota exceeded", 415},
    {"ReadOnly", "Error: Read-only file system", 411},
    {"NameTooLong", "Error: File name too long", 412, "LumoLibCheckEncryptShare"},
    {"NameTooLongEncrypted", "Error: File name too long", 413, "LumoLibCheckEncryptShare", {}, "/vault/z.zip"},
    {"NameTooLongShareUnknown", "Error: File name too long", 412, "LumoLibCheckEncryptShare syslog",
     {"Failed to get share info for /vault/z.zip"}, "/vault/z.zip", "LumoLibCheckEncryptShare=0"},
    {"SpaceBeforeQuota", "Error: Disk quota exceeded, No space left on device", 416},
    {"QuotaBeforeReadOnly", "Error: Read-only file system, Disk quota exceeded", 415},
    {"ReadOnlyBeforeName", "Error: File name too long, Read-only file system", 411},
    {"Other", "Error: what", 1300, "syslog", {"Error: what", ""}},
    {"MarkOfAnotherCase", "error: No space left on device\nError: x", 1300, "syslog", {"Error: x", ""}},
    {"CauseWithoutMark", "No space left on device\n Error:", 1300, "syslog", {" Error:", ""}},
};
// clang-format on

class RunFails : public RunTest, public testing::WithParamInterface<ErrorRow> {};

TEST_P(RunFails, WithTheCodeOfTheFirstErrorLine) {
  const ErrorRow& row = GetParam();
  ScriptArchiver(std::string("Total: 9\n") + row.line + "\nError: No space left on device\n");
  if (row.fault != nullptr) {
    Device::AddFault(row.fault);
  }
  EXPECT_EQ(FailJob(JobParams({"/photo/a.txt"}, row.dest)),
            Strings{row.dest + ": " + std::to_string(row.code)});
  EXPECT_EQ(Log(), row.log + Strings{"Failed to compress file " + row.dest});
  const Strings end = Behind(NamesOf(ExpectedSequence("failed_job")), "syslog");
  EXPECT_EQ(Behind(Sequence(Fork().result.asInt()), "SaveTaskData"),
            Words(row.after) + Words("access KLIBCPclose unlink syslog") + end);
}

INSTANTIATE_TEST_SUITE_P(ErrorLines, RunFails, ValuesIn(kErrors),
                         [](const auto& row) { return row.param.name; });

TEST_F(RunTest, ModeLevelFormatAndPasswordBecomeArguments) {
  const struct {
    const char* params;  // JSON
    const char* arguments;
  } rows[] = {
      {"{}", "|ARCHIVE|||-lang"},
      {R"({"mode":"","level":"","format":"","password":""})", "a|ARCHIVE||-mx6|-lang"},
      {R"({"mode":"add","level":"normal","format":"zip"})", "a|ARCHIVE||-mx6|-lang"},
      {R"({"mode":"update","level":"store","format":"7Z"})", "u|ARCHIVE||-mx0|-lang"},
      {R"({"mode":"freshen","level":"fastest","format":"7z"})", "u|ARCHIVE|-up1q1r0x1y2z1w2|-mx3"},
      {R"({"mode":"synchroize","level":"best","codepage":"CP932","password":"pass word"})",
       "u|ARCHIVE|-up1q0r2x1y2z1w2|-mx9|-langCP932|-ppass word"},
      {R"({"mode":"synchronize","level":"Best","format":"7z","codepage":"CP932"})",
       "a|ARCHIVE||-mx6"},
  };
  ScriptArchiver("");
  for (const auto& row : rows) {
    Json::Value params = Device::ParseJson(row.params);
    params["path"] = "/photo/a.txt";
    params["dest_file_path"] = "/photo/z.zip";
    RunJob(params);
    std::string text;
    const Json::Value arguments = Calls("KLIBCPopenv").back().args[2];
    for (const Json::Value& argument : arguments) {
      text += argument.asString() + "|";
    }
    std::string expected =
        std::string("/usr/bin/7z|") + row.arguments + "|-xr!@eaDir|@LIST|-progress|";
    expected.replace(expected.find("ARCHIVE"), 7, "-utf16|DEV/vol1/photo/z.zip");
    expected.replace(expected.find("LIST"), 4, "/tmp/lumozip*");
    EXPECT_EQ(Plain(text), expected);
  }
}

TEST_F(RunTest, ProgressLinesReachTheTask) {
  ScriptArchiver(
      "Progress: 7\nTotal: 5000000000\nCompressing photo/a.txt\nProgress: 42\nnoise\n Progress: 8\n"
      "Compressing b\nProgress: 43\nProgress: 99");
  const Json::Value answer = Run();
  Strings saved;
  for (const TracedCall& call : Calls("SaveTaskData")) {
    saved.push_back(Device::ToText(call.args[1]["file"]) + call.args[1]["total_size"].asString() +
                    " " + std::to_string(call.args[2].asFloat()));
  }
  EXPECT_EQ(saved,
            (Strings{"\"\"0 0.070000", "\"\"5000000000 0.000000", "\"\\n\"5000000000 0.420000",
                     "\"\\n\"5000000000 0.430000", "\"\\n\"5000000000 0.990000"}));
  // The last fraction stands, also when it is not 1.
  EXPECT_FLOAT_EQ(answer["progress"].asFloat(), 0.99F);
  EXPECT_FALSE(answer.isMember("errors"));
}

TEST_F(RunTest, AFileNameIsNoErrorLine) {
  ScriptArchiver(
      "Compressing Error: No space left on device\nTotal: Error: 3\nProgress: 3 Error:\n");
  EXPECT_FALSE(Run().isMember("errors"));
}

TEST_F(RunTest, ACompressingLineThatIsCutOffFailsTheJobAndLeavesNothing) {
  ScriptArchiver("Total: 3\nCompressing ");
  EXPECT_EQ(FailJob(JobParams({"/photo/a.txt"}, "/photo/z.zip")), Strings{"/photo/z.zip: 1300"});
  EXPECT_EQ(Calls("KLIBCPclose").size(), 1U);
  EXPECT_TRUE(StagedPaths().empty());
}

TEST_F(RunTest, WhatFailsBesideTheArchiverIsLoggedAndNoMore) {
  const struct {
    const char *fault, *line;
    int owner_calls;
  } rows[] = {
      {"SaveTaskData=0", "Failed to save task data", 1},
      {"KAVOFSAclChmod=-1", "failed to ACL chmod 'DEV/vol1/photo/z.zip' to 777, errno: Success", 1},
      {"LumoLibChown2Admin=-1", "LumoLibChown2Admin fail", 1},
      {"LumoLibChown2Admin=1", "LumoLibChown2Admin fail", 1},
      {"KLIBGroupIsAdminGroupMem=-1", "KLIBGroupIsAdminGroupMem(alice) failed. [0x0000 :0]", 0},
  };
  Add("vol1/photo/z.zip", "an archive");
  ScriptArchiver("Total: 3\n");
  for (const auto& row : rows) {
    Watch();
    Device::AddFault(row.fault);
    EXPECT_FALSE(Run().isMember("errors"));
    ASSERT_EQ(Log().size(), 1U) << row.fault;
    EXPECT_EQ(Log()[0].substr(0, Log()[0].rfind("errno")),
              std::string(row.line).substr(0, std::string(row.line).rfind("errno")));
    EXPECT_EQ(Calls("LumoLibChown2Admin").size(), static_cast<std::size_t>(row.owner_calls));
    EXPECT_EQ(Calls("KLIBKavoIndexAdd").size(), 1U);
  }
}

TEST_F(RunTest, AnErrorLineComesAfterAnArchiveIsThereAndItsOwnerIsSetAllTheSame) {
  Add("vol1/photo/z.zip", "an archive");
  Device::AddFault("LumoLibChown2Admin=-1");
  ScriptArchiver("Error: Read-only file system\n");
  EXPECT_EQ(FailJob(JobParams({"/photo/a.txt"}, "/photo/z.zip")),
            (Strings{"/photo/z.zip: 411", "/photo/z.zip: 401"}));
  Device::AddFault("KLIBGroupIsAdminGroupMem=-1");
  EXPECT_EQ(FailJob(JobParams({"/photo/a.txt"}, "/photo/z.zip")),
            (Strings{"/photo/z.zip: 411", "/photo/z.zip: 401"}));
  EXPECT_EQ(Calls("KLIBKavoIndexAdd").size(), 2U);
  EXPECT_TRUE(Calls("KAVOFSAclChmod").empty());
}

TEST_F(RunTest, WithoutASavedMaskTheProcessesMaskCounts) {
  ScriptArchiver("");
  Device::AddFault("LumoLibUmask=-1");
  Device::AddFault("LumoLibGetUmask=027");
  Run();
  EXPECT_EQ(Calls("KAVOFSAclChmod").back().args[2], 0640);
}

}  // namespace
