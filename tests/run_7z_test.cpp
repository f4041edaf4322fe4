// What the module hands to the archiver and makes of its lines, with a program in its place that
// prints them. Runs that fail stand in tests/tables/failed_jobs.
#include "device/base/json_text.h"
#include "device/platform/operations.h"
#include "tests/device_fixture.h"

namespace {

class RunTest : public DeviceTest {
 protected:
  RunTest() {
    Add("vol1/photo/a.txt", "a");
    Add("vol1/photo/z.zip", "an archive");
  }

  Json::Value Run(const std::string& output) {
    ScriptArchiver(output);
    return RunJob(JobParams({"/photo/a.txt"}, "/photo/z.zip"));
  }
};

TEST_F(RunTest, ModeLevelFormatAndPasswordBecomeArguments) {
  const struct {
    const char *params, *arguments;
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
    RunJob(JobParams({"/photo/a.txt"}, "/photo/z.zip", row.params));
    std::string text;
    const Json::Value arguments = Calls("KLIBCPopenv").back().args[2];
    for (const Json::Value& argument : arguments) {
      text += argument.asString() + "|";
    }
    std::string expected =
        std::string("/usr/bin/7z|") + row.arguments + "|-xr!@eaDir|@/tmp/lumozip*|-progress|";
    expected.replace(expected.find("ARCHIVE"), 7, "-utf16|DEV/vol1/photo/z.zip");
    EXPECT_EQ(WithPlaceholders(text), expected);
  }
}

TEST_F(RunTest, ProgressLinesReachTheTask) {
  const Json::Value answer =
      Run("Progress: 08\nTotal: 05000000000\nCompressing Error: No space left on device\n"
          "Progress: 42 Error:\nTotal:7\n Progress: 8\nCompressing \nTotal: 6\n"
          "Progress: 43\nProgress: 99");
  Strings saved;
  for (const TracedCall& call : Calls("SaveTaskData")) {
    saved.push_back(Device::ToText(call.args[1]["file"]) + call.args[1]["total_size"].asString() +
                    " " + std::to_string(call.args[2].asFloat()));
  }
  EXPECT_EQ(saved,
            (Strings{"\"\"0 0.080000", "\"\"5000000000 0.000000", "\"\\n\"5000000000 0.420000",
                     "\"\"6 0.000000", "\"\\n\"6 0.430000", "\"\\n\"6 0.990000"}));
  // The last fraction stands, also when it is not 1.
  EXPECT_FLOAT_EQ(answer["progress"].asFloat(), 0.99F);
  EXPECT_FALSE(answer.isMember("errors"));
}

TEST_F(RunTest, WhatFailsBesideTheArchiverIsLoggedAndNoMore) {
  const struct {
    const char *fault, *line;
    std::size_t owner_calls;
  } rows[] = {
      {"SaveTaskData=0", "Failed to save task data", 1},
      {"KAVOFSAclChmod=-1", "failed to ACL chmod 'DEV/vol1/photo/z.zip' to 777, errno: *", 1},
      {"LumoLibChown2Admin=-1", "LumoLibChown2Admin fail", 1},
      {"LumoLibChown2Admin=1", "LumoLibChown2Admin fail", 1},
      {"KLIBGroupIsAdminGroupMem=-1", "KLIBGroupIsAdminGroupMem(alice) failed. [0xBEEF lib.c:7]",
       0},
  };
  for (const auto& row : rows) {
    StartOver();
    AddFaults({row.fault, "KLIBCErrGet=48879", "KLIBCErrorGetFile=lib.c", "KLIBCErrorGetLine=7"});
    EXPECT_FALSE(Run("Total: Error: 3\n").isMember("errors"));
    EXPECT_EQ(Log(), Strings{row.line});
    EXPECT_EQ(Calls("LumoLibChown2Admin").size(), row.owner_calls);
    EXPECT_EQ(Calls("KLIBKavoIndexAdd").size(), 1U);
  }
}

TEST_F(RunTest, AnErrorLineComesAfterAnArchiveIsThereAndItsOwnerIsSetAllTheSame) {
  for (const char* fault : {"LumoLibChown2Admin=-1", "KLIBGroupIsAdminGroupMem=-1"}) {
    StartOver();
    Device::AddFault(fault);
    EXPECT_EQ(Device::ToText(Run("Error: Read-only file system\n")["errors"]),
              R"([{"code":411,"path":"/photo/z.zip"},{"code":401,"path":"/photo/z.zip"}])");
    EXPECT_EQ(Calls("KLIBKavoIndexAdd").size(), 1U);
    EXPECT_TRUE(Calls("KAVOFSAclChmod").empty());
  }
}

TEST_F(RunTest, WithoutASavedMaskTheProcessesMaskCounts) {
  AddFaults({"LumoLibUmask=-1", "LumoLibGetUmask=027"});
  Run("");
  EXPECT_EQ(Calls("KAVOFSAclChmod").back().args[2], 0640);
}

}  // namespace
