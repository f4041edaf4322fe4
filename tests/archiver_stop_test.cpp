// The archiver stopped, killed and overtaken: what it says, and what it leaves behind.
#include <fcntl.h>

#include <csignal>
#include <functional>

#include "tests/archiver_fixture.h"

namespace {

TEST_F(ArchiverTest, StopsWhenToldAndLeavesNothing) {
  for (const int signal : {SIGTERM, SIGINT, SIGHUP, 0}) {  // 0: nobody reads any more
    const auto run = Pack();
    EXPECT_NE(run->Seen().find("Total: 5368709120\n"), std::string::npos) << run->Seen();
    EXPECT_EQ(InOut().size(), 1U);
    EXPECT_FALSE(fs::exists(out / "new"));
    if (signal == 0) {
      run->CloseOutput();
    } else {
      kill(-run->Pid(), signal);
      EXPECT_TRUE(run->ReadUntil("\nError: cancelled\n"));
    }
    EXPECT_EQ(run->Wait(), 1);
    EXPECT_EQ(InOut(), Strings{});
  }
}

// What somebody does while 7z packs fails the job, for that reason.
void Surprise(Program& run, const std::function<void()>& deed, const std::string& reason) {
  kill(run.Pid(), SIGSTOP);
  deed();
  kill(run.Pid(), SIGCONT);
  EXPECT_EQ(run.Wait(), 1);
  EXPECT_TRUE(run.ReadUntil(reason)) << run.Seen();
}

TEST_F(ArchiverTest, DoesNotOverwriteWhatAnotherRunHasMade) {
  for (const bool exists : {false, true}) {
    if (exists) {
      WriteFile(share / "b", "b");
      Good("new", {"b"});
    }
    const auto run = Pack({}, 50 << 20);
    std::string other;
    const auto make = [&] { Good("new", {"a"}), other = ReadFile(out / "new"); };
    Surprise(*run, make, "it has changed meanwhile");
    EXPECT_EQ(ReadFile(out / "new"), other);
    EXPECT_EQ(InOut(), Strings{"new"});
  }
}

TEST_F(ArchiverTest, MakesNothingInAFolderThatHasMoved) {
  const auto run = Pack({}, 50 << 20);
  const auto move = [&] { fs::rename(out, root / "moved"), fs::create_directory(out); };
  Surprise(*run, move, "its folder has moved meanwhile");
  EXPECT_TRUE(fs::is_empty(out) && fs::is_empty(root / "moved"));
}

TEST_F(ArchiverTest, FailsWhenTwoSourcesWereExchanged) {
  for (const char* folder : {"one", "other"}) {
    WriteFile(share / folder / "huge", "");
    fs::resize_file(share / folder / "huge", 50 << 20);
  }
  Program run(CommandLine("new", {"one", "other"}, {}), share);
  EXPECT_TRUE(run.ReadUntil("Progress: 0\n")) << run.Seen();
  const auto exchange = [&] {
    renameat2(AT_FDCWD, (share / "one").c_str(), AT_FDCWD, (share / "other").c_str(),
              RENAME_EXCHANGE);
  };
  Surprise(run, exchange, "it was exchanged meanwhile");
  EXPECT_EQ(InOut(), Strings{});
}

TEST_F(ArchiverTest, SaysAHundredPercentWhenTheArchiveIsThere) {
  const auto run = Pack({}, 100 << 20);
  EXPECT_FALSE(fs::exists(out / "new"));
  EXPECT_TRUE(run->ReadUntil("Progress: 100\n"));
  EXPECT_TRUE(fs::exists(out / "new"));
}

}  // namespace
