// Sessions: their end, and how wrong passwords are slowed down.
#include <sys/wait.h>
#include <unistd.h>

#include "device/host/sessions.h"
#include "device/platform/lumo/errors.h"
#include "platform/lumo/file_manager.h"
#include "tests/device_fixture.h"

namespace {

using SessionTest = DeviceTest;

TEST_F(SessionTest, ItsEndReachesProcessesThatAreOnTheirWay) {
  for (const bool is_ended : {true, false}) {
    const std::string id = Device::SignIn("alice");
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    const pid_t pid = fork();
    if (pid == 0) {
      char go = 0;
      const bool may = read(ends[0], &go, 1) == 1 && LumoLibUGIDSet(id.c_str(), "alice") == 0;
      _exit(may ? 0 : LumoLibGetErr() - KAVO::kErrSystem);
    }
    if (is_ended) {
      Device::SignOut(id);
    }
    ASSERT_EQ(write(ends[1], "", 1), 1);
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    EXPECT_EQ(WEXITSTATUS(status), is_ended ? KAVO::kErrSession - KAVO::kErrSystem : 0);
    close(ends[0]);
    close(ends[1]);
  }
}

TEST_F(SessionTest, EachWrongPasswordAfterTheTenthDoublesTheWait) {
  using std::chrono::seconds;
  Device::SignInGate gate;
  Device::SignInGate::Clock::time_point now;
  for (int tries = 0; tries < 10; ++tries) {
    EXPECT_EQ(gate.Try("alice", "127.0.0.2", now), seconds(0)) << tries;
  }
  for (const int wait : {1, 2, 4, 8, 16, 32, 60, 60}) {
    EXPECT_EQ(gate.Try("alice", "127.0.0.3", now), seconds(wait));
    EXPECT_EQ(gate.Try("alice", "there", now), seconds(0));
    gate.Succeeded("alice", "there");
    now += seconds(wait);
    EXPECT_EQ(gate.Try("alice", "127.0.0.2", now), seconds(0));
  }
  gate.Succeeded("alice", "127.0.0.2");
  EXPECT_EQ(gate.Try("alice", "127.0.0.2", now), seconds(0));
}

}  // namespace
