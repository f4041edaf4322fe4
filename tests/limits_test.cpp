// Limits that the kernel sets: full, quota-bound and read-only file systems, mounted for the test
// alone.
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "tests/device_fixture.h"

namespace {

namespace fs = std::filesystem;

class LimitTest : public DeviceTest {
 protected:
  void SetUp() override {
    if (geteuid() != 0 || unshare(CLONE_NEWNS) != 0 ||
        mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) {
      GTEST_SKIP() << "mounting file systems needs root";
    }
    fs::create_directory(folder_);
    // Zeros that take no room, packed without compression.
    fs::resize_file(Add("vol1/photo/big", ""), 40 << 20);
  }

  void TearDown() override { umount2(folder_.c_str(), MNT_DETACH); }

  // The folder that was mounted on is alice's to write to.
  void Open() {
    ASSERT_EQ(chown(folder_.c_str(), 65001, Device::kUsersGroup), 0);
    ASSERT_EQ(chmod(folder_.c_str(), 0755), 0);
  }

  Strings Fail(const std::string& name) {
    return FailJob(JobParams({"/photo/" + name}, "/photo/limited/z.zip",
                             R"({"level":"store","codepage":"CP932"})"));
  }

  const std::string folder_ = At("vol1/photo/limited");
};

TEST_F(LimitTest, FullVolume) {
  Add("vol1/photo/日", std::string(900000, 'x'));
  for (const char* size : {"size=500k", "size=1500k"}) {  // one more copy, to recode, has no room
    ASSERT_EQ(mount("tmpfs", folder_.c_str(), "tmpfs", 0, size), 0);
    Open();
    EXPECT_EQ(Fail("日"), Strings{"/photo/limited/z.zip: 416"});
    EXPECT_TRUE(fs::is_empty(folder_));
    ASSERT_EQ(umount(folder_.c_str()), 0);
  }
}

TEST_F(LimitTest, Quota) {
  const std::string image = temp_.Path() + "/image";
  WriteFile(image, "");
  fs::resize_file(image, 200 << 20);
  ASSERT_EQ(RunProgram({"/usr/sbin/mkfs.btrfs", "-q", image}).status, 0);
  const Ran mounted = RunProgram({"/usr/bin/mount", "-o", "loop", image, folder_});
  if (mounted.status != 0) {
    GTEST_SKIP() << "no btrfs on a loop device here: " << mounted.err;
  }
  ASSERT_EQ(RunProgram({"/usr/bin/btrfs", "quota", "enable", folder_}).status, 0);
  ASSERT_EQ(RunProgram({"/usr/bin/btrfs", "qgroup", "limit", "8M", folder_}).status, 0);
  Open();
  EXPECT_EQ(Fail("big"), Strings{"/photo/limited/z.zip: 415"});
  EXPECT_TRUE(fs::is_empty(folder_));
}

}  // namespace
