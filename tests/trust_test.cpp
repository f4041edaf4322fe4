// Users of one shared folder who exchange what lies there while another user's job runs.
#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>

#include "device/base/child_process.h"
#include "device/base/fence.h"
#include "device/base/open_below.h"
#include "device/base/random_id.h"
#include "device/base/work_folder.h"
#include "tests/device_fixture.h"
#include "tests/libc_calls.h"
#include "tests/unpacked.h"

namespace {

namespace fs = std::filesystem;

constexpr uid_t kAlice = 65001, kBob = 65002;
constexpr char kSecret[] = "alice's private words";

struct stat Status(const std::string& path) {
  struct stat status {};
  EXPECT_EQ(lstat(path.c_str(), &status), 0) << path;
  return status;
}

// Bob's process, which does one thing over and over until the object goes.
class Attacker {
 public:
  explicit Attacker(const std::function<void()>& deed)
      : process_(Device::ChildProcess::Run([deed] {
          if (setgroups(0, nullptr) != 0 || setresgid(65100, 65100, 65100) != 0 ||
              setresuid(kBob, kBob, kBob) != 0) {
            return 1;
          }
          for (;;) {
            deed();
          }
        })) {}

 private:
  Device::ChildProcess process_;  // killed with the object
};

class TrustTest : public DeviceTest {
 protected:
  void SetUp() override {
    if (geteuid() != 0) {
      GTEST_SKIP() << "without root there are no other users";
    }
    Add("vol1/homes/alice/private", kSecret);
    chmod(private_.c_str(), 0600);
    for (int file = 0; file < 40; ++file) {
      Add("vol1/photo/trip/day/" + std::to_string(file), "public");
    }
    Add("vol1/photo/beside", "public");
  }

  // Jobs under the attack, done or failed: no archive holds the secret, and the file with it is as
  // it was.
  void Withstand(const std::function<void()>& deed, const Strings& sources, const char* options) {
    const Attacker attacker(deed);
    for (int round = 0; round < kRounds; ++round) {
      Follow(Call("start", JobParams(sources, "/photo/z.zip", options)).data["taskid"].asString());
      // It may be a link that bob has put there.
      const Device::FileDescriptor archive(
          open((photo_ + "/z.zip").c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
      EXPECT_EQ(ReadFile(Device::PathOf(archive.Get())).find(kSecret), std::string::npos);
      const struct stat status = Status(private_);
      EXPECT_EQ(status.st_mode & 0777, 0600U);
      EXPECT_EQ(status.st_uid, kAlice);
      EXPECT_EQ(ReadFile(private_), kSecret);
    }
  }

  static constexpr int kRounds = 15;
  const std::string photo_ = At("vol1/photo"), private_ = At("vol1/homes/alice/private");
};

TEST_F(TrustTest, WhoeverExchangesNamesReadsNothingAndChangesNothing) {
  if (!Device::Fence::IsSupported()) {
    GTEST_SKIP() << "the kernel has no Landlock";
  }
  const std::string trap = photo_ + "/trap";
  fs::create_directory(trap);
  fs::permissions(trap, fs::perms::all);
  const auto exchange = [](const std::string& one, const std::string& other) {
    renameat2(AT_FDCWD, one.c_str(), AT_FDCWD, other.c_str(), RENAME_EXCHANGE);
  };
  const auto link_to = [](const std::string& target, const std::string& name) {
    fs::remove_all(name);
    fs::create_symlink(target, name);
    lchown(name.c_str(), kBob, kBob);
  };
  link_to(private_.substr(0, private_.rfind('/')), trap + "/home");
  link_to(private_, trap + "/file");
  fs::create_directory(trap + "/job");
  link_to(private_, trap + "/job/new");
  link_to("../@eaDir/private", trap + "/left-out");
  Add("vol1/photo/trip/@eaDir/private", kSecret);
  constexpr char kStore[] = R"({"level":"store"})";

  // A file, with a link to one that the job leaves out.
  Withstand([&] { exchange(photo_ + "/trip/day/1", trap + "/left-out"); }, {"/photo/trip"}, kStore);
  // A selected folder, and one within.
  Withstand([&] { exchange(photo_ + "/trip", trap + "/home"); }, {"/photo/trip"}, kStore);
  Withstand([&] { exchange(photo_ + "/trip/day", trap + "/home"); }, {"/photo/trip"}, kStore);
  Withstand([&] { exchange(photo_ + "/trip", trap + "/home"); },
            {"/photo/trip/day/1", "/photo/trip/private"}, kStore);
  // The finished archive.
  Withstand([&] { exchange(photo_ + "/z.zip", trap + "/file"); }, {"/photo/beside"}, kStore);
  // The folder in which 7z writes.
  Withstand(
      [&] {
        std::error_code ignored;
        for (const auto& entry : fs::directory_iterator(photo_, ignored)) {
          if (Device::IsWorkFolderName(entry.path().filename())) {
            exchange(entry.path(), trap + "/job");
          }
        }
      },
      {"/photo/beside"}, kStore);
}

TEST_F(TrustTest, NoLinkIsFollowedOnTheWayToASourceOrADestination) {
  fs::create_symlink(At("vol2/vault"), photo_ + "/holiday");
  Add("vol2/vault/s.txt", "s");
  EXPECT_EQ(FailJob(JobParams({"/photo/holiday/s.txt"}, "/photo/z.zip")),
            Strings{"/photo/holiday/s.txt: 419"});
  EXPECT_EQ(FailJob(JobParams({"/photo/beside"}, "/photo/holiday/z.zip")).size(), 1U);
  EXPECT_EQ(FailJob(JobParams({"/photo/holiday/s.txt", "/music"}, "/photo/z.zip")).size(), 1U);
  EXPECT_FALSE(fs::exists(At("vol2/vault/z.zip")));
}

TEST_F(TrustTest, OtherJobsFoldersAreLeftOutAndBlockNothing) {
  for (const char* folder : {"vol1/photo/", "vol1/photo/trip/day/"}) {
    const std::string other = At(folder) + Device::NewWorkFolderName();
    fs::create_directory(other);
    WriteFile(other + "/new", "bob's");
    chown(other.c_str(), kBob, kBob);
    chmod(other.c_str(), 0700);
  }
  fs::create_directory(photo_ + "/.kavo-7z-abcdef");
  for (const char* format : {"zip", "7z"}) {
    const std::string archive = At(std::string("vol1/music/z.") + format);
    const Json::Value answer = RunJob(JobParams({"/photo"}, std::string("/music/z.") + format,
                                                std::string(R"({"format":")") + format + "\"}"));
    EXPECT_FALSE(answer.isMember("errors")) << answer;
    const Tree tree = Unpacked(archive);
    EXPECT_EQ(tree.size(), 45U);  // two folders, 41 files, the folder of the like name, the share
    EXPECT_EQ(tree.count("photo/.kavo-7z-abcdef/"), 1U);
  }
}

TEST_F(TrustTest, WhatKilledJobsLeaveGoesWithTheNextAndNothingElseDoes) {
  fs::resize_file(Add("vol1/photo/zeros", ""), std::uintmax_t{1} << 40U);
  const auto jobs_folders = [&] {
    Strings found;
    for (const auto& entry : fs::directory_iterator(photo_)) {
      if (Device::IsWorkFolderName(entry.path().filename())) {
        found.push_back(entry.path());
      }
    }
    return found;
  };
  setenv("ROOTS_TOKEN", "geheim", 1);
  const Device::FileDescriptor roots(open(private_.c_str(), O_RDONLY));
  Call("start", JobParams({"/photo/zeros"}, "/photo/z.zip", R"({"password":"geheim"})"));
  ASSERT_TRUE(WaitUntil([&] { return Group(Worker()).size() >= 3 && !jobs_folders().empty(); }));
  for (const auto& process : fs::directory_iterator("/proc")) {
    EXPECT_EQ(ReadFile(process.path() / "cmdline").find("geheim"), std::string::npos);
  }
  // The user can make the archiver do anything, also with root's terminal, variables and files.
  const std::string own_errors = fs::read_symlink("/proc/self/fd/2");
  for (const pid_t pid : Group(Worker())) {
    EXPECT_EQ(getsid(pid), Worker());
    const std::string process = "/proc/" + std::to_string(pid);
    for (const auto& fd : fs::directory_iterator(process + "/fd")) {
      const std::string file = fs::read_symlink(fd);
      EXPECT_TRUE(pid == Worker() || file == "/dev/null" ||
                  (file != own_errors && file != private_));
    }
    EXPECT_TRUE(pid == Worker() ||
                ReadFile(process + "/environ").find("geheim") == std::string::npos);
  }
  kill(-Worker(), SIGKILL);
  ASSERT_TRUE(WaitUntil([&] { return Group(Worker()).empty(); }));
  EXPECT_EQ(jobs_folders().size(), 1U);
  EXPECT_EQ(StagedPaths().size(), 1U);

  // It only looks like a job's.
  const std::string own = photo_ + "/" + Device::NewWorkFolderName();
  WriteFile(own + "/newsletter.txt", "mine");
  chown(own.c_str(), kAlice, 65100);
  chmod(own.c_str(), 0700);
  RunJob(JobParams({"/photo/beside"}, "/music/z.zip"));
  EXPECT_EQ(jobs_folders(), Strings{own});
  EXPECT_TRUE(fs::exists(own + "/newsletter.txt") && StagedPaths().empty());
}

// Lists of which nothing is noted: their workers were killed while they wrote them, or are of
// another device.
TEST_F(TrustTest, OldListsAreRemovedWithTheNextJob) {
  constexpr uid_t kOther = 65009;  // bob's own jobs, of other tests, would remove bob's
  const auto unused = [] { return "/tmp/lumozip" + Device::RandomId(1).substr(2); };
  const std::string of_links = unused(), of_other = unused();
  const struct {
    std::string path;
    int age;  // seconds
    uid_t owner;
    bool stays;
  } rows[] = {{unused(), 3600, kAlice, false},
              {unused(), 60, kAlice, true},
              {unused(), 3600, kOther, true},
              {unused() + ".txt", 3600, kAlice, true},
              {of_links + "/lumozip-inner", 3600, kAlice, false},
              {of_links + "/lumozip-young", 60, kAlice, true},
              {of_links + "/newsletter.txt", 3600, kAlice, true},
              {of_other + "/lumozip-inner", 3600, kAlice, true}};
  for (const auto& row : rows) {
    WriteFile(row.path, "list");
    chmod(row.path.c_str(), 0600);
    chown(row.path.c_str(), row.owner, 65100);
    fs::last_write_time(row.path, fs::file_time_type::clock::now() - std::chrono::seconds(row.age));
  }
  chown(of_links.c_str(), kAlice, 65100);
  chown(of_other.c_str(), kOther, 65100);
  chmod(of_links.c_str(), 0700);
  chmod(of_other.c_str(), 0755);
  RunJob(JobParams({"/photo/beside"}, "/photo/z.zip"));
  for (const auto& row : rows) {
    EXPECT_EQ(fs::remove(row.path), row.stays) << row.path;
  }
  fs::remove(of_links);
  fs::remove(of_other);
}

TEST_F(TrustTest, AFailedJobTouchesNothingThatIsNoArchive) {
  fs::create_directory(photo_ + "/folder");
  mkfifo((photo_ + "/pipe").c_str(), 0600);
  Add("vol1/photo/image", "x");
  fs::create_hard_link(photo_ + "/image", photo_ + "/second");
  for (const char* name : {"/folder", "/pipe", "/second"}) {
    chown((photo_ + name).c_str(), kAlice, 65100);
    const struct stat before = Status(photo_ + name);
    EXPECT_EQ(FailJob(JobParams({"/photo/beside"}, std::string("/photo") + name)).size(), 1U);
    EXPECT_EQ(Status(photo_ + name).st_gid, before.st_gid) << name;
    EXPECT_EQ(Status(photo_ + name).st_mode, before.st_mode) << name;
  }
}

TEST(Fence, HoldsAProgramToWhatWasAllowed) {
  if (!Device::Fence::IsSupported()) {
    GTEST_SKIP() << "the kernel has no Landlock";
  }
  const TempFolder temp;
  for (const char* name : {"/source/a", "/neighbour/b", "/room/old"}) {
    WriteFile(temp.Path() + name, "x");
  }
  const auto open_folder = [&](const char* name) {
    return Device::FileDescriptor(open((temp.Path() + name).c_str(), O_PATH | O_CLOEXEC));
  };
  Device::Fence fence;
  fence.AllowReading(open_folder("/source").Get());
  fence.AllowWriting(open_folder("/room").Get());
  const Device::FileDescriptor folder = open_folder("");
  const struct {
    const char* script;
    bool is_allowed;
  } rows[] = {{"cat source/a >room/new && mv room/new room/z && rm room/old", true},
              {"head -c 1 /dev/urandom", true},
              {"cat neighbour/b", false},
              {"ln -s ../neighbour/b room/l; cat room/l", false},
              {"echo x >beside", false},
              {"echo x >source/a", false},
              {"rm source/a", false},
              {"mv room/z beside", false},
              {"ln source/a room/hard", false},
              {"ls neighbour", false},
              {"cat /etc/passwd", false},
              {"exec 3<>/dev/tcp/127.0.0.1/9", false},
              {"kill -0 $PPID", false}};
  for (const auto& row : rows) {
    Device::ProgramStart start;
    start.program = "/bin/bash";
    start.arguments = {"bash", "-c", row.script};
    start.folder = folder.Get();
    start.fence = &fence;
    EXPECT_EQ(Device::ChildProcess::Start(start).Wait() == 0, row.is_allowed) << row.script;
  }
}

}  // namespace
