// The commands of kavo-device, as programs.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>

#include "device/bodies/config.h"
#include "device/bodies/json_text.h"
#include "tests/device_fixture.h"

namespace {

namespace fs = std::filesystem;

using Strings = std::vector<std::string>;
using testing::HasSubstr;
using testing::ValuesIn;

class CliTest : public DeviceTest {
 protected:
  static Ran Kavo(Strings arguments) {
    const fs::path here = fs::read_symlink("/proc/self/exe");
    arguments.insert(arguments.begin(), (here.parent_path() / "kavo-device").string());
    return RunProgram(arguments);
  }
};

TEST_F(CliTest, SampleDevicePacksFromTwoShares) {
  const std::string sample = temp_.Path() + "/sample";
  ASSERT_EQ(Kavo({"init", sample}).status, 0);
  const Ran ran = Kavo({"compress", sample, "--user", "alice", "/photo/trip/day1/b, the second.jpg",
                        "/music/album", "/photo/both.7z", "--level", "store"});
  EXPECT_EQ(ran.status, 0) << ran.err;
  EXPECT_THAT(ran.out, testing::EndsWith("\n/photo/both.7z\n"));
  const Ran listing = RunProgram({"/usr/bin/7z", "l", "-ba", sample + "/vol1/photo/both.7z"});
  EXPECT_THAT(listing.out, HasSubstr("photo/trip/day1/b, the second.jpg"));
  EXPECT_THAT(listing.out, HasSubstr("music/album/02.mp3"));
  EXPECT_EQ(Kavo({"init", sample}).status, 2);
}

TEST_F(CliTest, CallAnswersOnOneLineAndDoesNotWaitForTheWorker) {
  fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
  const Ran started = Kavo({"call", device_, "--user", "alice", "start", "path=/photo/zeros",
                            R"(dest_file_path=["/photo/z.7z"])", "format=7z", "level=best"});
  EXPECT_EQ(started.status, 0) << started.err;
  const Json::Value answer = Device::ParseJson(started.out);
  const std::string task = answer["data"]["taskid"].asString();
  EXPECT_EQ(started.out, R"({"code":0,"data":{"taskid":")" + task + "\"}}\n");
  EXPECT_THAT(Kavo({"tasks", device_, "--user", "alice"}).out, HasSubstr(task + "\trunning\t"));
  EXPECT_EQ(Kavo({"tasks", device_, "--user", "bob"}).out, "");
  const Ran stopped = Kavo({"call", device_, "--user", "alice", "stop", "taskid=" + task});
  EXPECT_EQ(stopped.out, "{\"code\":0,\"data\":null}\n");
  EXPECT_EQ(Kavo({"tasks", device_, "--user", "alice"}).out, "");
}

TEST_F(CliTest, WhatCallAcceptsTheTaskListReadsBack) {
  const std::string deep(Device::kParamDepth, '[');
  EXPECT_EQ(Kavo({"call", device_, "--user", "alice", "start", "path=/photo/a", "dest_file_path=/z",
                  "mode:=" + deep + std::string(deep.size(), ']')})
                .status,
            0);
  EXPECT_THAT(Kavo({"tasks", device_, "--user", "alice"}).out, HasSubstr("Zantro_"));
}

TEST_F(CliTest, NobodyFollowsACallSoTheDesktopIsNotified) {
  Add("vol1/photo/a.txt", "a");
  EXPECT_EQ(Kavo({"call", device_, "--user", "alice", "start", "path=/photo/a.txt",
                  "dest_file_path=/photo/z.zip"})
                .status,
            0);
  Ran ran;
  ASSERT_TRUE(WaitUntil([&] {
    ran = Kavo({"notifications", device_, "--user", "alice"});
    return !ran.out.empty();
  }));
  EXPECT_THAT(ran.out, HasSubstr("filebrowser:filebrowser_compress_completed\t/photo/z.zip\n"));
}

TEST_F(CliTest, CompressShowsEachErrorInWordsAndTheLogOnStandardError) {
  Add("vol1/photo/a.txt", "a");
  const Ran ran = Kavo({"compress", device_, "--user", "alice", "/photo/a.txt", "/photo/no.txt",
                        "/photo/z.zip", "--fault", "ACLAccess#2=1:407"});
  EXPECT_EQ(ran.status, 1);
  EXPECT_THAT(ran.out, testing::EndsWith("/photo/a.txt: 407 no privilege\n"
                                         "/photo/no.txt: 408 no such file or folder\n"));
  EXPECT_THAT(ran.err, HasSubstr("KAVO.Zantro.Compress:"));
  EXPECT_THAT(ran.err, HasSubstr(" Can't access source files\n"));
}

TEST_F(CliTest, InterruptedCompressStopsItsJob) {
  fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
  const std::string trace = temp_.Path() + "/cli-trace";
  const std::string program =
      (fs::read_symlink("/proc/self/exe").parent_path() / "kavo-device").string();
  const pid_t pid = fork();
  if (pid == 0) {
    dup2(open((temp_.Path() + "/out").c_str(), O_WRONLY | O_CREAT, 0600), STDOUT_FILENO);
    execl(program.c_str(), program.c_str(), "compress", device_.c_str(), "--user", "alice",
          "/photo/zeros", "/photo/z.7z", "--trace", trace.c_str(), nullptr);
    _exit(127);
  }
  ASSERT_TRUE(WaitUntil([&] { return ReadFile(trace).find("KLIBCPopenv") != std::string::npos; }));
  kill(pid, SIGINT);
  int status = 0;
  waitpid(pid, &status, 0);
  EXPECT_EQ(WEXITSTATUS(status), 1);
  EXPECT_THAT(ReadFile(temp_.Path() + "/out"), testing::EndsWith("/photo/z.7z: stopped\n"));
  EXPECT_EQ(Kavo({"tasks", device_, "--user", "alice"}).out, "");
}

struct UsageRow {
  const char* name;
  Strings arguments;  // "DEV" stands for the device
  std::string words;  // on standard error
};
void PrintTo(const UsageRow& row, std::ostream* out) { *out << row.name; }

// clang-format off
const UsageRow kUsage[] = {
    {"NoCommand", {}, "subcommand is required"},
    {"NoSuchDevice", {"tasks", "/no/such", "--user", "alice"},
     "cannot open device '/no/such': No such file or directory\n"},
    {"FolderIsNoDevice", {"tasks", "/proc", "--user", "alice"}, "device.json: No such file"},
    {"NoSuchUser", {"tasks", "DEV", "--user", "mallory"}, "no user 'mallory'"},
    {"ParameterWithoutName", {"call", "DEV", "--user", "alice", "status", "=x"}, "parameter '=x'"},
    {"ParameterIsNoJson", {"call", "DEV", "--user", "alice", "status", "x:={"},
     "parameter 'x': line 1"},
    {"ParameterIsNestedTooDeep",
     {"call", "DEV", "--user", "alice", "status", "x:=\n" + std::string(1000, '[')},
     "parameter 'x': line 2: nested too deep\n"},
    {"UnknownOperation", {"call", "DEV", "--user", "alice", "status", "--fault", "Lumo=1"},
     "fault rule 'Lumo=1': no operation 'Lumo'"},
    {"RuleWithoutResult", {"call", "DEV", "--user", "alice", "status", "--fault", "DoKill"},
     "expected CALL[#N]=RESULT[:CODE]"},
    {"TraceNotOpened", {"call", "DEV", "--user", "alice", "status", "--trace", "/no/such/file"},
     "cannot open trace file '/no/such/file': No such file or directory"},
    {"NoPasswordFile",
     {"compress", "DEV", "--user", "alice", "/photo/a", "/photo/z", "--password-file", "/no/pw"},
     "/no/pw: No such file or directory"},
    {"UnknownLevel", {"compress", "DEV", "--user", "alice", "/photo/a", "/photo/z", "--level", "9"},
     "--level: 9 not in"},
    {"NoDestination", {"compress", "DEV", "--user", "alice", "/photo/a"}, "paths"},
};
// clang-format on

class CliRefuses : public CliTest, public testing::WithParamInterface<UsageRow> {};

TEST_P(CliRefuses, WithStatusTwoAndOneLine) {
  Strings arguments = GetParam().arguments;
  std::replace(arguments.begin(), arguments.end(), std::string("DEV"), device_);
  const Ran ran = Kavo(arguments);
  EXPECT_EQ(ran.status, 2);
  EXPECT_EQ(ran.out, "");
  EXPECT_THAT(ran.err, HasSubstr(GetParam().words));
}

INSTANTIATE_TEST_SUITE_P(Usage, CliRefuses, ValuesIn(kUsage),
                         [](const auto& row) { return row.param.name; });

struct ConfigRow {
  const char* name;
  const char* text;
  const char* error;
};
void PrintTo(const ConfigRow& row, std::ostream* out) { *out << row.name; }

// clang-format off
const ConfigRow kConfigs[] = {
    {"UnknownKey", "{\n\"volum\": [] }", "line 2: unknown key 'volum'"},
    {"MissingKey", R"({"volumes": [], "users": []})", "line 1: the device lacks 'shares'"},
    {"NoObject", "[]", "line 1: the device is not an object"},
    {"Syntax", "{\n\n\"volumes\" [] }", "line 3: Missing ':' after object member name"},
    {"RepeatedKey", "{\"volumes\": [],\n\"volumes\": []}", "line 2: Duplicate key: 'volumes'"},
    {"UidOfRoot", R"({"volumes":["v"],"shares":[],"users":[{"name":"a","uid":0,"home":"v"}]})",
     "line 1: 'uid' is not a number above 0"},
    {"TwiceTheSameUid",
     R"({"volumes":["v"],"shares":[],"users":[{"name":"a","uid":7,"home":"v"},
{"name":"b","uid":7,"home":"v"}]})",
     "line 2: user 'b' has the name or uid of another"},
    {"HomeOnNoVolume", R"({"volumes":["v"],"shares":[],"users":[{"name":"a","uid":7,"home":"w"}]})",
     "line 1: no volume 'w'"},
    {"NameWithSlash", R"({"volumes":["a/../.."],"shares":[],"users":[]})",
     "line 1: 'a/../..' is not a valid name"},
    {"ShareNamedHome",
     R"({"volumes":["v"],"users":[],"shares":[{"name":"home","volume":"v","access":{}}]})",
     "line 1: the name 'home' is taken"},
    {"VolumeOfTheStores", R"({"volumes":["users"],"users":[],"shares":[]})",
     "line 1: the name 'users' is taken"},
    {"AccessForNobody",
     R"({"volumes":["v"],"users":[],"shares":[{"name":"s","volume":"v","access":{"x":"rw"}}]})",
     "line 1: no user 'x'"},
};
// clang-format on

class ConfigRefuses : public testing::TestWithParam<ConfigRow> {};

TEST_P(ConfigRefuses, NamingLineAndReason) {
  try {
    Device::ParseConfig(GetParam().text);
    ADD_FAILURE() << "accepted";
  } catch (const std::runtime_error& error) {
    EXPECT_STREQ(error.what(), GetParam().error);
  }
}

INSTANTIATE_TEST_SUITE_P(Config, ConfigRefuses, ValuesIn(kConfigs),
                         [](const auto& row) { return row.param.name; });

// A device below a folder that is closed to its users works all the same, and the folder stays
// shut.
TEST_F(CliTest, DeviceInAClosedFolder) {
  const std::string closed = temp_.Path() + "/closed";
  fs::create_directory(closed);
  fs::permissions(closed, fs::perms::owner_all);
  const std::string sample = closed + "/deeper/device";
  ASSERT_EQ(Kavo({"init", sample}).status, 0);
  const Ran ran = Kavo({"compress", sample, "--user", "bob", "/photo/cat.jpg", "/photo/cat.zip"});
  EXPECT_EQ(ran.status, 0) << ran.out << ran.err;
  EXPECT_TRUE(fs::exists(sample + "/vol1/photo/cat.zip"));
  EXPECT_EQ(fs::status(closed).permissions(), fs::perms::owner_all);
}

}  // namespace
