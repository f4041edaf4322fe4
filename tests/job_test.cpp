// Whole jobs with the real archiver: what stands in the archive afterwards.
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <map>
#include <sstream>

#include "device/bodies/device.h"
#include "device/bodies/operations.h"
#include "device/bodies/task_store.h"
#include "tests/device_fixture.h"
#include "tests/libc_calls.h"

namespace {

namespace fs = std::filesystem;

using Tree =
    std::map<std::string, std::string>;  // path to contents; "/" for a folder, "->x" a link

// All that is below a folder.
Tree ReadTree(const std::string& folder) {
  Tree tree;
  for (const fs::directory_entry& entry : fs::recursive_directory_iterator(folder)) {
    const std::string name = entry.path().lexically_relative(folder).string();
    tree[name] = entry.is_symlink()     ? "->" + fs::read_symlink(entry.path()).string()
                 : entry.is_directory() ? "/"
                                        : ReadFile(entry.path().string());
  }
  return tree;
}

class JobTest : public DeviceTest {
 protected:
  // Unpacks into a folder of its own: a zip with unzip, which 7z must find sound too.
  Tree Unpack(const std::string& archive, const std::string& password = "") {
    const TempFolder to;
    const bool is_zip = archive.find(".7z") == std::string::npos;
    const std::string option = is_zip ? "t" : "x";
    Ran ran = RunProgram({"/usr/bin/7z", option, "-p" + password, "-o" + to.Path(), At(archive)});
    EXPECT_EQ(ran.status, 0) << ran.out << ran.err;
    if (is_zip) {
      ran = RunProgram({"/usr/bin/unzip", "-q", "-P", password, At(archive), "-d", to.Path()});
      EXPECT_EQ(ran.status, 0) << ran.out << ran.err;
    }
    return ReadTree(to.Path());
  }

  void Succeed(const Json::Value& params, const std::string& user = "alice") {
    const Json::Value answer = RunJob(params, user);
    EXPECT_FALSE(answer.isMember("errors")) << answer;
    EXPECT_TRUE(Log().empty()) << Log().front();
  }

  static Json::Value With(Json::Value params, const std::string& name, const std::string& value) {
    params[name] = value;
    return params;
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
  for (const std::string format : {"zip", "7z"}) {
    Succeed(
        With(JobParams({"/photo/trip", "/photo/home"}, "/photo/z." + format), "format", format));
    EXPECT_EQ(Unpack("vol1/photo/z." + format), (Tree{{"home", "h"},
                                                      {"trip", "/"},
                                                      {"trip/b.jpg", "b"},
                                                      {"trip/day1", "/"},
                                                      {"trip/day1/a.jpg", std::string(100000, 'a')},
                                                      {"trip/empty", "/"},
                                                      {"trip/link", "->b.jpg"}}))
        << format;
  }
  EXPECT_TRUE(StagedPaths().empty());
}

TEST_F(JobTest, SourcesOfSeveralSharesAreNamedFromTheirShare) {
  Add("vol1/photo/trip/a.jpg", "a");
  Add("vol1/music/same", "music");
  Add("vol1/photo/same", "photo");
  Add("vol2/vault/deep/er/s.txt", "s");
  fs::create_symlink("/etc/passwd", At("vol1/photo/trip/out"));
  fs::create_symlink("..", At("vol1/photo/trip/round"));
  Succeed(JobParams({"/photo/trip", "/music", "/photo/same", "/vault/deep/er"}, "/photo/z.zip"));
  Tree tree = Unpack("vol1/photo/z.zip");
  for (const char* link : {"photo/trip/out", "photo/trip/round"}) {
    if (tree.count(link) != 0) {
      EXPECT_EQ(tree[link].substr(0, 2), "->");  // never what the link leads to
      tree.erase(link);
    }
  }
  EXPECT_EQ(tree, (Tree{{"music", "/"},
                        {"music/same", "music"},
                        {"photo", "/"},
                        {"photo/same", "photo"},
                        {"photo/trip", "/"},
                        {"photo/trip/a.jpg", "a"},
                        {"vault", "/"},
                        {"vault/deep", "/"},
                        {"vault/deep/er", "/"},
                        {"vault/deep/er/s.txt", "s"}}));
  // The list file is gone; the folder of links is left behind, as every caller knows.
  ASSERT_EQ(StagedPaths().size(), 1U);
  EXPECT_TRUE(fs::is_symlink(StagedPaths().front() + "/music"));
}

TEST_F(JobTest, LevelsReachTheArchive) {
  const std::string text(300000, 'x');
  Add("vol1/photo/a.txt", text);
  std::map<std::string, std::uintmax_t> sizes;
  for (const std::string level : {"store", "fastest", "normal", "best"}) {
    Succeed(With(JobParams({"/photo/a.txt"}, "/photo/" + level + ".zip"), "level", level));
    EXPECT_EQ(Unpack("vol1/photo/" + level + ".zip"), (Tree{{"a.txt", text}}));
    sizes[level] = fs::file_size(At("vol1/photo/" + level + ".zip"));
  }
  EXPECT_GT(sizes["store"], text.size());
  EXPECT_LT(sizes["best"], text.size() / 10);
}

TEST_F(JobTest, ArchiveLiesInASourceAndDoesNotHoldItself) {
  Add("vol1/photo/trip/a.txt", "a");
  for (int round = 0; round < 2; ++round) {
    Succeed(JobParams({"/photo/trip"}, "/photo/trip/z.zip"));
    EXPECT_EQ(Unpack("vol1/photo/trip/z.zip"), (Tree{{"trip", "/"}, {"trip/a.txt", "a"}}));
  }
}

TEST_F(JobTest, ArchiveNameMayHaveTheLongestName) {
  Add("vol1/photo/a.txt", "a");
  const std::string name(255, 'n');
  Succeed(JobParams({"/photo/a.txt"}, "/photo/" + name));
  Succeed(JobParams({"/photo/a.txt"}, "/photo/" + name));  // once more, over the first
  EXPECT_EQ(Unpack("vol1/photo/" + name), (Tree{{"a.txt", "a"}}));
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
  EXPECT_FALSE(fs::exists(At("vol1/photo/z.zip")));
  EXPECT_TRUE(fs::is_empty(At("vol1/homes/carol")));
}

TEST_F(JobTest, TenThousandSources) {
  Strings sources;
  for (int file = 0; file < 10000; ++file) {
    const std::string name = "f" + std::to_string(file);
    Add("vol1/photo/" + name, name);
    sources.push_back("/photo/" + name);
  }
  Device::StopWatching();
  EXPECT_FALSE(
      RunJob(With(JobParams(sources, "/photo/z.zip"), "level", "store")).isMember("errors"));
  const Tree tree = Unpack("vol1/photo/z.zip");
  EXPECT_EQ(tree.size(), 10000U);
  EXPECT_EQ(tree.at("f9999"), "f9999");
}

}  // namespace
