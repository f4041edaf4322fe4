// Whole jobs with the real archiver: what stands in the archive afterwards.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "tests/device_fixture.h"
#include "tests/libc_calls.h"
#include "tests/unpacked.h"

namespace {

namespace fs = std::filesystem;

constexpr std::time_t kLinkTime = 1'000'000'000;  // in September 2001

class JobTest : public DeviceTest {
 protected:
  void Succeed(const Json::Value& params, const std::string& user = "alice") {
    const Json::Value answer = RunJob(params, user);
    EXPECT_FALSE(answer.isMember("errors")) << answer;
    EXPECT_TRUE(Log().empty()) << Log().front();
  }
};

TEST_F(JobTest, SourcesOfOneShareAreNamedFromTheirCommonParent) {
  Add("vol1/photo/trip/day1/a.jpg", std::string(100000, 'a'));
  Add("vol1/photo/trip/day1/@eaDir/a.jpg/thumb", "no");
  Add("vol1/photo/trip/b.jpg", "b");
  Add("vol1/photo/home", "h");
  Add("vol1/photo/left.jpg", "no");
  fs::create_directory(At("vol1/photo/trip/empty"));
  fs::create_symlink("b.jpg", At("vol1/photo/trip/link"));
  const Tree expected = {"home=h",
                         "trip/",
                         "trip/b.jpg=b",
                         "trip/day1/",
                         "trip/empty/",
                         "trip/day1/a.jpg=" + std::string(100000, 'a'),
                         "trip/link -> b.jpg"};
  for (const std::string format : {"zip", "7z"}) {
    Succeed(JobParams({"/photo/trip", "/photo/home"}, "/photo/z." + format,
                      R"({"format":")" + format + "\"}"));
    EXPECT_EQ(Unpacked(At("vol1/photo/z." + format)), expected);
  }
  EXPECT_TRUE(StagedPaths().empty());
}

// The shares lie in one folder, then scattered.
TEST_F(JobTest, SourcesOfSeveralSharesAreNamedFromTheirShareWithLinksKept) {
  Add("vol1/photo/trip/a.jpg", "a");
  Add("vol1/photo/unlisted/b", "b");
  Add("vol1/music/same", "music");
  Add("vol1/photo/same", "photo");
  Add("vol2/vault/deep/er/s.txt", "s");
  fs::create_symlink("../../../outside", At("vol1/photo/trip/out\xFF"));
  fs::create_symlink("nowhere", At("vol1/photo/trip/broken"));
  fs::create_symlink("..", At("vol1/music/round"));
  const timespec times[] = {{kLinkTime, 0}, {kLinkTime, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, At("vol1/music/round").c_str(), times, AT_SYMLINK_NOFOLLOW), 0);
  ASSERT_EQ(mkfifo(At("vol1/music/pipe").c_str(), 0644), 0);
  Strings sources = {"/photo/trip", "/music", "/photo/same"};
  std::size_t jobs = 0;
  Tree expected = {"music/",
                   "music/pipe=",
                   "music/round -> ..",
                   "music/same=music",
                   "photo/",
                   "photo/same=photo",
                   "photo/trip/",
                   "photo/trip/a.jpg=a",
                   "photo/trip/broken -> nowhere",
                   "photo/trip/out\xFF -> ../../../outside"};
  for (const std::string format : {"7z", "zip"}) {
    StartOver();
    Succeed(JobParams(sources, "/photo/z." + format, R"({"format":")" + format + "\"}"));
    EXPECT_EQ(Unpacked(At("vol1/photo/z." + format)), expected);
    const Ran listing =
        RunProgram({"/usr/bin/7z", "l", At("vol1/photo/z." + format), "music/round"});
    EXPECT_NE(listing.out.find("2001-09-0"), std::string::npos) << listing.out;
    const Ran pipe =
        RunProgram({"/usr/bin/7z", "l", "-slt", At("vol1/photo/z." + format), "music/pipe"});
    EXPECT_NE(pipe.out.find("rw-r--"), std::string::npos) << pipe.out;
    // The list file is gone; the folder of links is left behind, as every caller knows.
    ASSERT_EQ(StagedPaths().size(), ++jobs);
    EXPECT_TRUE(fs::is_symlink(StagedPaths().back() + "/music"));
    sources.push_back("/vault/deep/er");
    expected.insert({"vault/", "vault/deep/", "vault/deep/er/", "vault/deep/er/s.txt=s"});
  }
}

TEST_F(JobTest, ArchiveOfTheLongestNameLiesInASourceAndDoesNotHoldItself) {
  Add("vol1/photo/trip/a.txt", "a");
  const std::string archive = "photo/trip/" + std::string(255, 'n');
  for (int round = 0; round < 2; ++round) {
    Succeed(JobParams({"/photo/trip"}, "/" + archive));
    EXPECT_EQ(Unpacked(At("vol1/" + archive)), (Tree{"trip/", "trip/a.txt=a"}));
  }
}

TEST_F(JobTest, ArchiveBelongsToItsMakerAndIsIndexed) {
  Add("vol1/photo/a.txt", "a");
  Succeed(JobParams({"/photo/a.txt"}, "/photo/alice.zip"));
  Succeed(JobParams({"/photo/a.txt"}, "/photo/bob.zip"), "bob");
  EXPECT_EQ(Calls("KLIBKavoIndexAdd").size(), 2U);
  for (const std::string user : {"alice", "bob"}) {
    struct stat status {};
    ASSERT_EQ(stat(At("vol1/photo/" + user + ".zip").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0666U);
    if (geteuid() == 0) {
      EXPECT_EQ(status.st_uid, user == "alice" ? 65001U : 65002U);
      EXPECT_EQ(status.st_gid, user == "alice" ? Device::kAdminsGroup : Device::kUsersGroup);
    }
  }
}

TEST_F(JobTest, WhatTheUserMayNotReadFailsTheJob) {
  if (geteuid() != 0) {
    GTEST_SKIP() << "without root every user is the owner of all files";
  }
  Add("vol1/photo/trip/open", "a");
  chmod(Add("vol1/photo/trip/closed", "b").c_str(), 0);
  EXPECT_EQ(FailJob(JobParams({"/photo/trip"}, "/photo/z.zip"), "bob"),
            Strings{"/photo/z.zip: 1300"});
  EXPECT_EQ(FailJob(JobParams({"/photo/trip/closed"}, "/photo/z.zip"), "bob"),
            Strings{"/photo/trip/closed: 407"});
  EXPECT_EQ(FailJob(JobParams({"/music"}, "/home/z.zip"), "carol"), Strings{"/music: 407"});
  EXPECT_EQ(FailJob(JobParams({"/photo"}, "/home/z.zip"), "carol"),
            (Strings{"/photo: 407", "/home/z.zip: 1300"}));
  chmod(At("vol1/photo/trip").c_str(), 0744);
  EXPECT_EQ(FailJob(JobParams({"/photo/trip"}, "/photo/z.zip"), "bob"),
            Strings{"/photo/trip: 407"});
  EXPECT_FALSE(fs::exists(At("vol1/photo/z.zip")));
  EXPECT_TRUE(fs::is_empty(At("vol1/homes/carol")));
}

TEST_F(JobTest, AnArchiveOfWholeSharesDoesNotHoldItself) {
  Add("vol1/photo/a", "a");
  Add("vol1/music/b", "b");
  for (int round = 0; round < 2; ++round) {
    Succeed(JobParams({"/photo", "/music"}, "/photo/z.zip"));
    EXPECT_EQ(Unpacked(At("vol1/photo/z.zip")),
              (Tree{"music/", "music/b=b", "photo/", "photo/a=a"}));
  }
}

TEST_F(JobTest, AGroupsFileIsReadByItsMembersAlone) {
  if (geteuid() != 0) {
    GTEST_SKIP() << "without root every user is the owner of all files";
  }
  const struct {
    gid_t group;
    bool is_read_by_alice, is_read_by_bob;
  } rows[] = {
      {Device::kAdminsGroup, true, false}, {Device::kUsersGroup, true, true}, {0, false, false}};
  for (const auto& row : rows) {
    const std::string file = At("vol1/homes/shared");
    WriteFile(file, "text");
    ASSERT_EQ(chown(file.c_str(), 0, row.group), 0);
    ASSERT_EQ(chmod(file.c_str(), 0040), 0);
    for (const std::string user : {"alice", "bob"}) {
      const std::string link = At("vol1/homes/" + user + "/file");
      fs::remove(link);
      fs::create_hard_link(file, link);
      const bool is_read = user == "alice" ? row.is_read_by_alice : row.is_read_by_bob;
      EXPECT_EQ(RunJob(JobParams({"/home/file"}, "/home/z.zip"), user).isMember("errors"), !is_read)
          << user << row.group;
    }
    fs::remove(file);
  }
}

}  // namespace
