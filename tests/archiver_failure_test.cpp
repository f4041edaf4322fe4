#include <grp.h>
#include <sched.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/prctl.h>

#include "device/archiver/cancel.h"
#include "device/archiver/failure.h"
#include "device/archiver/report.h"
#include "device/archiver/stock_7z.h"
#include "tests/archiver_test_support.h"
#include "tests/emulation.h"

namespace ArchiverTest {
namespace {

constexpr uint64_t kHuge = 5ULL << 30U;  // sparse: it takes seconds to pack, and no room

class Failing : public ArchiverFixture {
 protected:
  void Bad(const Outcome& outcome, const std::string& cause) {
    EXPECT_NE(outcome.status, 0);
    EXPECT_EQ(outcome.Last().rfind("Error: ", 0), 0U) << outcome.text;
    EXPECT_NE(outcome.Last().find(cause), std::string::npos) << outcome.text;
    EXPECT_EQ(outcome.text.find("Error:"), outcome.text.rfind("Error:")) << outcome.text;
    EXPECT_EQ(outcome.Count("Progress: 100"), 0);
  }
  void MakeHuge() {
    WriteFile(share / "huge", "");
    fs::resize_file(share / "huge", kHuge);
  }
};

TEST_F(Failing, NamesWhatIsMissingAndLeavesTheOldArchive) {
  WriteFile(share / "a", "a");
  ASSERT_EQ(Pack(out / "old", {"a"}).status, 0);
  const std::string old = ReadFile(out / "old");
  for (const char* target : {"new", "old"}) {
    Bad(Pack(out / target, {"a", "mis*sing"}), "mis*sing");
    Bad(Pack(out / target, {"a", "a/below"}), "a/below");
  }
  EXPECT_EQ(InOut(), Strings{"old"});
  EXPECT_EQ(ReadFile(out / "old"), old);
}

TEST_F(Failing, RefusesTargetsThatAreNoArchiveOfTheType) {
  WriteFile(share / "a", "a");
  WriteFile(out / "junk", "no archive");
  WriteFile(out / "empty", "");
  ASSERT_EQ(Pack(out / "seven", {"a"}).status, 0);
  fs::create_symlink("seven", out / "link");
  fs::create_directory(out / "folder");
  Options zip;
  zip.code_page = "CP932";
  const Strings before = InOut();
  for (const std::string& name : before) {
    const bool file = fs::is_regular_file(fs::symlink_status(out / name));
    const std::string content = file ? ReadFile(out / name) : "";
    Bad(Pack(out / name, {"a"}, zip), "");
    EXPECT_EQ(file ? ReadFile(out / name) : "", content);
  }
  Bad(Pack(out / "link", {"a"}), "link");
  Bad(Pack(out / std::string(256, 'n'), {"a"}), "File name too long");
  Bad(Pack(root / "missing/new", {"a"}), "No such file");
  EXPECT_EQ(InOut(), before);
  EXPECT_FALSE(fs::exists(root / "missing"));
}

TEST_F(Failing, SaysWhyARequestCannotBeMet) {
  WriteFile(share / "a", "a");
  const struct {
    const char *page, *password;
    Strings sources;
    const char* cause;
  } cases[] = {{nullptr, "", {}, "names no files"},
               {"CP9x32", "", {"a"}, "unknown code page 'CP9x32'"},
               {"", "pä", {"a"}, "ASCII"},
               {nullptr, "a\nb", {"a"}, "line break"},
               {nullptr, "", {"@eaDir/x"}, "excluded"},
               {nullptr, "", {"../share/a"}, "../share/a"}};
  for (const auto& c : cases) {
    Options options;
    options.code_page = c.page;
    options.password = c.password;
    Bad(Pack(out / "new", c.sources, options), c.cause);
  }
  Bad(Execute({KAVO_7Z_PATH, "x", out / "new"}, folder), "command");
  EXPECT_EQ(InOut(), Strings{});
}

TEST_F(Failing, StopsAtOnceAndLeavesNothing) {
  MakeHuge();
  const bool adopts_orphans = prctl(PR_SET_CHILD_SUBREAPER, 1) == 0;
  ASSERT_TRUE(adopts_orphans || kIsEmulated);  // an emulator may not know of it
  for (const int signal : {SIGTERM, SIGINT, SIGHUP, SIGKILL, 0}) {  // 0: nobody reads any more
    Program program(CommandLine(out / "new", {"huge"}), folder);
    ASSERT_TRUE(program.ReadUntil("Compressing huge\n"));
    EXPECT_NE(program.Seen().find("Total: 5368709120\n"), std::string::npos) << program.Seen();
    EXPECT_EQ(InOut().size(), 1U);
    EXPECT_FALSE(fs::exists(out / "new"));
    const auto start = std::chrono::steady_clock::now();
    if (signal == 0) {
      program.CloseOutput();
    } else {
      kill(signal == SIGKILL ? program.Pid() : -program.Pid(), signal);
    }
    EXPECT_EQ(program.Wait(), signal == SIGKILL ? -SIGKILL : 1);
    int status = 0;
    if (signal == SIGKILL) {  // the supervisor's; the job, an orphan now, cancels itself
      EXPECT_EQ(waitpid(-1, &status, 0) > 0, adopts_orphans);
      EXPECT_TRUE(program.ReadUntil("\nError: cancelled\n"));
    }
    EXPECT_EQ(InOut(), Strings{});
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(kSlowness));
    EXPECT_EQ(waitpid(-1, &status, WNOHANG), -1);
    WriteFile(share / "a", "a");
  }
}

TEST_F(Failing, SaysSoWhenTheJobIsKilledAndSweepsLater) {
  MakeHuge();
  Program program(CommandLine(out / "new", {"huge"}), folder);
  ASSERT_TRUE(program.ReadUntil("Compressing huge\n"));
  const std::string supervisor = std::to_string(program.Pid());
  const int job = std::stoi(ReadFile("/proc/" + supervisor + "/task/" + supervisor + "/children"));
  ASSERT_EQ(kill(job, SIGKILL), 0);
  EXPECT_EQ(program.Wait(), 1);
  EXPECT_TRUE(program.ReadUntil("\nError: the archiver was killed\n"));
  EXPECT_EQ(InOut().size(), 1U);
  WriteFile(share / "a", "a");
  // The stock 7z dies with its parent, in its own time; then nothing holds the lock.
  for (int tries = 0; tries < 1000 && InOut() != Strings{"other"}; ++tries) {
    fs::remove(out / "other");
    EXPECT_EQ(Pack(out / "other", {"a"}).status, 0);
  }
  EXPECT_EQ(InOut(), Strings{"other"});
}

TEST_F(Failing, DoesNotOverwriteWhatAnotherRunHasMade) {
  MakeHuge();
  WriteFile(share / "a", "a");
  for (const bool exists : {false, true}) {
    if (exists) {
      WriteFile(share / "b", "b");
      ASSERT_EQ(Pack(out / "new", {"b"}).status, 0);
    }
    fs::resize_file(share / "huge", 200 << 20);
    Program program(CommandLine(out / "new", {"huge"}), folder);
    ASSERT_TRUE(program.ReadUntil("Compressing huge\n"));
    ASSERT_EQ(Pack(out / "new", {"a"}).status, 0);
    const std::string other = ReadFile(out / "new");
    EXPECT_EQ(program.Wait(), 1);
    EXPECT_TRUE(program.ReadUntil("it has changed meanwhile"));
    EXPECT_EQ(ReadFile(out / "new"), other);
    EXPECT_EQ(InOut(), Strings{"new"});
  }
}

TEST_F(Failing, SparesTheFolderOfARunThatIsAlive) {
  MakeHuge();
  WriteFile(share / "a", "a");
  Program program(CommandLine(out / "new", {"huge"}), folder);
  ASSERT_TRUE(program.ReadUntil("Compressing huge\n"));
  ASSERT_EQ(InOut().size(), 1U);
  const std::string alive = InOut().front();
  EXPECT_EQ(Pack(out / "other", {"a"}).status, 0);
  EXPECT_EQ(InOut(), (Strings{alive, "other"}));
}

TEST_F(Failing, HidesThePasswordFromOtherUsers) {
  if (kIsEmulated) {
    GTEST_SKIP() << "what a program makes of its arguments is the emulator's own memory";
  }
  MakeHuge();
  Options options;
  options.password = "geheim";
  Program program(CommandLine(out / "new", {"huge"}, options), folder);
  ASSERT_TRUE(program.ReadUntil("Compressing huge\n"));
  size_t processes = 0;
  for (const auto& entry : fs::directory_iterator("/proc")) {
    const std::string command = ReadFile(entry.path() / "cmdline");
    processes += command.find(list.string()) != std::string::npos ||
                         command.find(out.string()) != std::string::npos
                     ? 1
                     : 0;
    EXPECT_EQ(command.find("geheim"), std::string::npos) << command;
  }
  EXPECT_EQ(processes, 3U);  // supervisor, job, stock 7z
}

TEST_F(Failing, TellsHowThe7zEnded) {
  const struct {
    const char *program, *script, *cause;
  } cases[] = {
      {"/nonexistent/7z", "", "cannot start '/nonexistent/7z': No such file"},
      {"/bin/sh", "kill -9 $$", "killed by signal 9"},
      {"/bin/sh", "exit 2", "status 2"},
      {"/bin/sh", "echo 'ERROR: oops' >&2", "oops"},
      {"/bin/sh", "printf 'WARNING: errno=2 : Gone\\na\\n' >&2; exec sleep 60", "Gone; a"}};
  for (const auto& c : cases) {
    const Archiver::Cancel cancel(STDOUT_FILENO);
    Archiver::Report report(cancel);
    Archiver::Child7z child;
    child.program = c.program;
    child.arguments = {"-c", c.script};
    child.folder = "/";
    try {
      Archiver::Run7z(child, cancel, report);
      ADD_FAILURE() << "succeeded: " << c.script;
    } catch (const Archiver::Failure& failure) {
      EXPECT_NE(std::string(failure.what()).find(c.cause), std::string::npos) << failure.what();
    }
  }
}

}  // namespace
}  // namespace ArchiverTest
