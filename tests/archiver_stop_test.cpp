// The archiver stopped, killed and overtaken: what it says, and what it leaves behind.
#include <csignal>

#include "tests/archiver_fixture.h"
#include "tests/emulation.h"

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

TEST_F(ArchiverTest, SparesTheFolderOfARunThatIsAliveAndSweepsThatOfOneThatWasKilled) {
  const auto run = Pack();
  Strings before = InOut();
  ASSERT_EQ(before.size(), 1U);
  Good("other", {"a"});
  EXPECT_EQ(InOut(), (Strings{before.front(), "other"}));

  ASSERT_EQ(kill(run->Pid(), SIGKILL), 0);
  EXPECT_EQ(run->Wait(), -SIGKILL);
  EXPECT_EQ(InOut().size(), 2U);
  // The stock 7z dies with its parent, in its own time; then nothing holds the lock.
  for (int tries = 0; tries < 1000 && InOut() != Strings{"other"}; ++tries) {
    Good("other", {"a"});
  }
  EXPECT_EQ(InOut(), Strings{"other"});
}

TEST_F(ArchiverTest, DoesNotOverwriteWhatAnotherRunHasMade) {
  for (const bool exists : {false, true}) {
    if (exists) {
      WriteFile(share / "b", "b");
      Good("new", {"b"});
    }
    const auto run = Pack({}, 200 << 20);
    Good("new", {"a"});
    const std::string other = ReadFile(out / "new");
    EXPECT_EQ(run->Wait(), 1);
    EXPECT_TRUE(run->ReadUntil("\nCompressing huge\nProgress: "));
    EXPECT_TRUE(run->ReadUntil("it has changed meanwhile"));
    EXPECT_EQ(ReadFile(out / "new"), other);
    EXPECT_EQ(InOut(), Strings{"new"});
  }
}

TEST_F(ArchiverTest, SaysAHundredPercentWhenTheArchiveIsThere) {
  const auto run = Pack({}, 100 << 20);
  EXPECT_FALSE(fs::exists(out / "new"));
  EXPECT_TRUE(run->ReadUntil("Progress: 100\n"));
  EXPECT_TRUE(fs::exists(out / "new"));
}

TEST_F(ArchiverTest, HidesThePasswordFromOtherUsers) {
  if (kIsEmulated) {
    GTEST_SKIP() << "what a program makes of its arguments is the emulator's own memory";
  }
  const auto run = Pack({"a", "", "geheim", nullptr});
  bool is_seen = false;
  for (const auto& entry : fs::directory_iterator("/proc")) {
    const std::string command = ReadFile(entry.path() / "cmdline");
    is_seen = is_seen || command.find(root.string()) != std::string::npos;
    EXPECT_EQ(command.find("geheim"), std::string::npos) << command;
  }
  EXPECT_TRUE(is_seen);
}

}  // namespace
