// The commands of kavo-device, as programs.
#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <regex>

#include "device/base/json_text.h"
#include "device/model/config.h"
#include "tests/device_fixture.h"
#include "tests/emulation.h"

namespace {

namespace fs = std::filesystem;

using testing::Each;
using testing::HasSubstr;
using testing::Not;

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
  EXPECT_EQ(ran.out, "/photo/both.7z\n");
  const Ran listing = RunProgram({"/usr/bin/7z", "l", "-ba", sample + "/vol1/photo/both.7z"});
  EXPECT_THAT(listing.out, HasSubstr("photo/trip/day1/b, the second.jpg"));
  EXPECT_THAT(listing.out, HasSubstr("music/album/02.mp3"));
  EXPECT_EQ(Kavo({"init", sample}).status, 2);
  // The folder of links that such a job leaves.
  std::error_code ignored;
  for (const auto& entry : fs::directory_iterator("/tmp")) {
    if (fs::read_symlink(entry.path() / "photo", ignored) == sample + "/vol1/photo") {
      fs::remove_all(entry.path());
    }
  }
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

TEST_F(CliTest, CompressShowsEachErrorInWordsAndTheLogWhenItIsWatched) {
  Add("vol1/photo/a.txt", "a");
  const Strings job = {"/photo/a.txt", "/photo/no.txt", "/photo/z.zip"};
  const Ran watched = As("alice", "compress", job + Strings{"--fault", "ACLAccess#2=1:407"});
  EXPECT_EQ(watched.status, 1);
  EXPECT_EQ(watched.out, "");
  EXPECT_THAT(watched.err, HasSubstr("kavo-device: /photo/a.txt: no privilege (407)\n"
                                     "kavo-device: /photo/no.txt: no such file or folder (408)\n"));
  EXPECT_THAT(watched.err, HasSubstr(" Can't access source files\n"));
  const Ran json = As("alice", "compress", job + Strings{"--json"});
  EXPECT_EQ(Device::ParseJson(json.out)["errors"][0]["path"], "/photo/no.txt");
  EXPECT_THAT(json.err,
              testing::EndsWith("kavo-device: /photo/no.txt: no such file or folder (408)\n"));
  EXPECT_THAT(json.err, Not(HasSubstr("Can't access")));
}

// The API tells a folder's full path there.
TEST_F(CliTest, NamesFoldersAsUsersDo) {
  Add("vol1/homes/alice/a.txt", "a");
  const Ran missing = As("alice", "compress", {"a.txt", "/photo/none/z.zip"});
  EXPECT_THAT(missing.err, HasSubstr("device: /photo/none: no such file or folder (408)\n"));
  const Ran homeless = As("alice", "compress", {"a.txt", "none/z.zip"});
  EXPECT_THAT(homeless.err, HasSubstr("device: /home/none: no such file or folder (408)\n"));
  fs::create_directory(At("vol1/homes/alice/z.7z"));
  const Ran no_file = As("alice", "compress", {"a.txt", "z.7z"});
  EXPECT_THAT(no_file.err, HasSubstr("z.7z: the archive could not be made (1300): "));
  EXPECT_THAT(no_file.err, Not(HasSubstr(device_)));
  EXPECT_EQ(As("alice", "compress", {"a.txt", "z.ZIP"}).out, "/home/z.ZIP\n");
  EXPECT_EQ(As("alice", "ls", {"."}).out, "a.txt\nz.7z/\nz.ZIP\n");
  EXPECT_THAT(As("carol", "ls").out, Not(HasSubstr("vault")));
}

TEST_F(CliTest, ADetachedJobIsFoundStoppedAndDismissed) {
  fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
  const auto detach = [&](const Strings& paths) {
    const Ran ran = As("alice", "compress", paths + Strings{"--detach"});
    return ran.out.substr(0, ran.out.find('\n'));
  };
  const auto state = [&](const std::string& task) {
    const Ran ran = As("alice", "status", {task, "--json"});
    return Device::ParseJson(ran.out)["state"].asString();
  };
  const std::string endless = detach({"/photo/zeros", "/photo/z.7z"});
  EXPECT_EQ(As("alice", "dismiss", {endless}).status, 1);
  EXPECT_EQ(state(endless), "running");
  EXPECT_EQ(As("bob", "stop", {endless}).status, 1);
  EXPECT_EQ(As("alice", "stop", {endless}).status, 0);
  EXPECT_THAT(As("alice", "status", {endless}).err, HasSubstr(endless + ": no such task"));

  const std::string failed = detach({"/photo/none", "/photo/z.7z"});
  ASSERT_TRUE(WaitUntil([&] { return state(failed) == "failed"; }));
  EXPECT_THAT(As("alice", "tasks").out,
              HasSubstr("\t/photo/z.7z\t/photo/none: no such file or folder (408)\n"));
  EXPECT_EQ(As("alice", "dismiss", {failed}).status, 0);
  EXPECT_EQ(As("alice", "tasks", {"--json"}).out, "{\"tasks\":[]}\n");
}

TEST_F(CliTest, APasswordIsTheFirstLineOfItsFile) {
  Add("vol1/photo/a.txt", "a");
  const std::string file = temp_.Path() + "/password";
  WriteFile(file, "one two\r\nthree\n");
  As("alice", "compress", {"/photo/a.txt", "/photo/z.7z", "--password-file", file});
  EXPECT_EQ(RunProgram({"/usr/bin/7z", "t", "-pone two", At("vol1/photo/z.7z")}).status, 0);
  EXPECT_NE(RunProgram({"/usr/bin/7z", "t", "-pnone", At("vol1/photo/z.7z")}).status, 0);
}

TEST_F(CliTest, InterruptedCompressStopsItsJob) {
  fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
  const std::string trace = temp_.Path() + "/cli-trace";
  Program compress({Built("kavo-device"), "compress", device_, "--user", "alice", "/photo/zeros",
                    "/photo/z.7z", "--trace", trace},
                   "/", temp_.Path() + "/err");
  ASSERT_TRUE(WaitUntil([&] { return ReadFile(trace).find("KLIBCPopenv") != std::string::npos; }));
  kill(compress.Pid(), SIGINT);
  EXPECT_EQ(compress.Wait(), 128 + SIGINT);
  compress.ReadToEnd();
  EXPECT_EQ(compress.Seen(), "");
  EXPECT_THAT(ReadFile(temp_.Path() + "/err"), testing::EndsWith("/photo/z.7z: stopped\n"));
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

TEST_F(ShellTest, ServesWhereSystemdListensAndTellsThatItIsReady) {
  const int listening = socket(AF_INET, SOCK_STREAM, 0);
  listen(listening, 1);  // at any free port
  sockaddr_in address{};
  socklen_t size = sizeof address;
  getsockname(listening, reinterpret_cast<sockaddr*>(&address), &size);
  const std::string path = temp_.Path() + "/ready";
  sockaddr_un ready_address{AF_UNIX, {}};
  path.copy(ready_address.sun_path, path.size());
  const int ready = socket(AF_UNIX, SOCK_DGRAM, 0);
  bind(ready, reinterpret_cast<sockaddr*>(&ready_address), sizeof ready_address);

  Program serve({"/bin/bash", "-c",
                 "exec 3<&" + std::to_string(listening) + "; NOTIFY_SOCKET=" + path +
                     " LISTEN_PID=$$ LISTEN_FDS=1 exec " + Built("kavo-device") + " serve " +
                     device_ + " --json"},
                "/", temp_.Path() + "/err");
  char message[100] = "";
  recv(ready, message, sizeof message - 1, 0);
  EXPECT_STREQ(message, "READY=1");
  EXPECT_TRUE(
      serve.ReadUntil("http://0.0.0.0:" + std::to_string(ntohs(address.sin_port)) + "/\"}\n"));
  const int client = socket(AF_INET, SOCK_STREAM, 0);
  ASSERT_EQ(connect(client, reinterpret_cast<sockaddr*>(&address), size), 0);
  dprintf(client, "GET /codes HTTP/1.1\r\nHost: localhost\r\n\r\n");
  recv(client, message, strlen("HTTP/1.1 200"), MSG_WAITALL);
  EXPECT_THAT(message, testing::StartsWith("HTTP/1.1 200"));
  for (const int fd : {listening, ready, client}) {
    close(fd);
  }
}

TEST_F(ShellTest, OutputThatCannotBeWrittenIsNoSuccess) {
  Add("vol1/photo/a.txt", "a");
  const std::string device = " " + device_ + " --user alice ";
  for (const std::string& command :
       {"init --json " + temp_.Path() + "/new", std::string("--help"),
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

// Each line drawn over the one before, on terminals of several widths.
TEST_F(ShellTest, TheBarKeepsInsideTheWindowAndEndsAtAHundred) {
  Add("vol1/photo/日本 の写真.jpg", std::string(1 << 20, 'x'));
  for (const std::size_t columns : {8U, 30U, 60U, 200U}) {
    const std::string command = "stty cols " + std::to_string(columns) +
                                "; NO_COLOR=1 TERM=xterm " + Built("kavo-device") + " compress " +
                                device_ + " --user alice /photo /home/z.7z";
    const Ran ran = RunProgram({"/usr/bin/script", "-qec", command, "/dev/null"});
    Strings drawn = Lines(std::regex_replace(ran.out, std::regex("\r(\x1b\\[K)?"), "\n"));
    drawn.erase(std::remove(drawn.begin(), drawn.end(), ""), drawn.end());
    ASSERT_GE(drawn.size(), 2U) << ran.out;
    EXPECT_EQ(drawn.back(), "/home/z.7z");
    drawn.pop_back();
    EXPECT_THAT(drawn.back(), testing::StartsWith("100 %"));
    EXPECT_EQ(drawn.back().find("1.0 MiB") != std::string::npos, columns >= 60);
    EXPECT_THAT(drawn, Each(testing::SizeIs(testing::Lt(columns))));
  }
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
