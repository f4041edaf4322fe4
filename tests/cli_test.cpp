// The commands of kavo-device, as programs.
#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "device/base/json_text.h"
#include "device/model/config.h"
#include "tests/device_fixture.h"
#include "tests/emulation.h"

namespace {

namespace fs = std::filesystem;

using testing::HasSubstr;

class CliTest : public DeviceTest {
 protected:
  static Ran Kavo(const Strings& arguments) {
    return RunProgram(Strings{Built("kavo-device")} + arguments);
  }
  // On the test's own device.
  Ran As(const std::string& user, const std::string& command, const Strings& arguments = {}) {
    return Kavo(Strings{command, device_, "--user", user} + arguments);
  }
};

// Commands as a shell starts them.
class ShellTest : public CliTest {
 protected:
  void SetUp() override {
    if (kIsEmulated) {
      GTEST_SKIP() << "the shell is none of the emulated programs, and cannot start one";
    }
  }
};

TEST_F(CliTest, SampleDevicePacksFromTwoShares) {
  const std::string sample = temp_.Path() + "/sample";
  ASSERT_EQ(Kavo({"init", sample}).status, 0);
  const Ran ran = Kavo({"compress", sample, "--user", "alice", "/photo/trip/day1/b, the second.jpg",
                        "/music/album", "/photo/both.7z", "--level", "store"});
  EXPECT_EQ(ran.status, 0) << ran.err;
  EXPECT_THAT(ran.out, testing::EndsWith("/photo/both.7z\n"));
  const Ran listing = RunProgram({"/usr/bin/7z", "l", "-ba", sample + "/vol1/photo/both.7z"});
  EXPECT_THAT(listing.out, HasSubstr("photo/trip/day1/b, the second.jpg"));
  EXPECT_THAT(listing.out, HasSubstr("music/album/02.mp3"));
  EXPECT_EQ(Kavo({"init", sample}).status, 2);
}

TEST_F(CliTest, CallAnswersOnOneLineAndDoesNotWaitForTheWorker) {
  fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
  const Ran started = As("alice", "call",
                         {"start", "path=/photo/zeros", R"(dest_file_path=["/photo/z.7z"])",
                          "format=7z", "level=best"});
  EXPECT_EQ(started.status, 0) << started.err;
  const Json::Value answer = Device::ParseJson(started.out);
  const std::string task = answer["data"]["taskid"].asString();
  EXPECT_EQ(started.out, R"({"code":0,"data":{"taskid":")" + task + "\"}}\n");
  EXPECT_THAT(As("alice", "tasks").out, HasSubstr(task + "\trunning\t"));
  const Ran stopped = As("alice", "call", {"stop", "taskid=" + task});
  EXPECT_EQ(stopped.out, "{\"code\":0,\"data\":null}\n");
  EXPECT_EQ(As("alice", "tasks").out, "");
}

TEST_F(CliTest, CompressShowsEachErrorInWordsAndTheLogOnStandardError) {
  Add("vol1/photo/a.txt", "a");
  const Ran ran =
      As("alice", "compress",
         {"/photo/a.txt", "/photo/no.txt", "/photo/z.zip", "--fault", "ACLAccess#2=1:407"});
  EXPECT_EQ(ran.status, 1);
  EXPECT_THAT(ran.out, testing::EndsWith("/photo/a.txt: 407 no privilege\n"
                                         "/photo/no.txt: 408 no such file or folder\n"));
  EXPECT_THAT(ran.err, HasSubstr("KAVO.Zantro.Compress:"));
  EXPECT_THAT(ran.err, HasSubstr(" Can't access source files\n"));
}

TEST_F(CliTest, InterruptedCompressStopsItsJob) {
  fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
  const std::string trace = temp_.Path() + "/cli-trace";
  Program compress({Built("kavo-device"), "compress", device_, "--user", "alice", "/photo/zeros",
                    "/photo/z.7z", "--trace", trace},
                   "/");
  ASSERT_TRUE(WaitUntil([&] { return ReadFile(trace).find("KLIBCPopenv") != std::string::npos; }));
  kill(compress.Pid(), SIGINT);
  EXPECT_EQ(compress.Wait(), 1);
  compress.ReadToEnd();
  EXPECT_THAT(compress.Seen(), testing::EndsWith("/photo/z.7z: stopped\n"));
  EXPECT_EQ(As("alice", "tasks").out, "");
}

TEST_F(ShellTest, AnyStandardStreamMayBeClosed) {
  Add("vol1/photo/a.txt", "a");
  for (const std::string closed : {"<&-", ">&-", "2>&-", "<&- >&- 2>&-"}) {
    const std::string compress = Built("kavo-device") + " compress " + device_ +
                                 " --user alice /photo/a.txt /photo/z.zip " + closed;
    EXPECT_EQ(RunProgram({"/bin/sh", "-c", compress}).status, 0) << closed;
    EXPECT_TRUE(fs::remove(At("vol1/photo/z.zip"))) << closed;
  }
  Program serve(
      {"/bin/sh", "-c",
       "exec " + Built("kavo-device") + " serve " + device_ + " --listen 127.0.0.1:0 <&- 2>&-"},
      "/");
  EXPECT_TRUE(serve.ReadUntil("' on http://127.0.0.1:"));
  kill(serve.Pid(), SIGTERM);
  EXPECT_EQ(serve.Wait(), 0);
}

TEST_F(ShellTest, OutputThatCannotBeWrittenIsNoSuccess) {
  Add("vol1/photo/a.txt", "a");
  const std::string device = " " + device_ + " --user alice ";
  for (const std::string& command :
       {"init " + temp_.Path() + "/new", std::string("--help"),
        "call" + device + "start path=/photo/a.txt dest_file_path=/photo/c.zip", "tasks" + device,
        "compress" + device + "/photo/a.txt /photo/z.zip",
        "serve " + device_ + " --listen 127.0.0.1:0"}) {
    const std::string line = Built("kavo-device") + " " + command + " >/dev/full";
    const Ran full = RunProgram({"/bin/sh", "-c", line});
    EXPECT_EQ(full.status, 1) << command;
    EXPECT_THAT(full.err, HasSubstr("standard output: No space left on device\n")) << command;
  }
  EXPECT_TRUE(fs::exists(At("vol1/photo/z.zip")));
}

TEST_F(ShellTest, EndsQuietlyWhenTheReaderOfItsOutputIsGone) {
  const std::string errors = temp_.Path() + "/err";
  Program unread({"/bin/sh", "-c", "kill -STOP $$; exec " + Built("kavo-device") + " --help"}, "/",
                 errors);
  waitpid(unread.Pid(), nullptr, WUNTRACED);
  unread.CloseOutput();
  kill(unread.Pid(), SIGCONT);
  EXPECT_EQ(unread.Wait(), -SIGPIPE);
  EXPECT_EQ(ReadFile(errors), "");
}

class CliRefuses : public CliTest, public testing::WithParamInterface<TableRow> {};

TEST_P(CliRefuses, WithStatusTwoAndOneLine) {
  Strings arguments = Words(GetParam().Get("command"));
  std::replace(arguments.begin(), arguments.end(), std::string("DEV"), device_);
  const Ran ran = Kavo(arguments);
  EXPECT_EQ(ran.status, 2);
  EXPECT_EQ(ran.out, "");
  EXPECT_THAT(ran.err, HasSubstr(GetParam().Get("words")));
}

INSTANTIATE_TABLE(CliRefuses, wrong_usage, "command", "words");

class ConfigRefuses : public testing::TestWithParam<TableRow> {};

TEST_P(ConfigRefuses, NamingLineAndReason) {
  try {
    Device::ParseConfig(GetParam().Get("text"));
    ADD_FAILURE() << "accepted";
  } catch (const std::runtime_error& error) {
    EXPECT_EQ(error.what(), GetParam().Get("error"));
  }
}

INSTANTIATE_TABLE(ConfigRefuses, wrong_configs, "text", "error");

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
