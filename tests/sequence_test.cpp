// Every call that the module makes in each kind of run, in order and with its arguments; the lists
// stand in tests/sequences. Failures are tested against their beginnings.
#include <gmock/gmock.h>

#include "device/platform/operations.h"
#include "tests/device_fixture.h"

namespace {

using testing::ElementsAreArray;

class SequenceTest : public DeviceTest {
 protected:
  SequenceTest() {
    for (const char* name : {"photo/trip/a.txt", "photo/trip/day/b.txt", "music/m.txt"}) {
      Add(std::string("vol1/") + name, "text");
    }
    Add("vol1/photo/out.zip", "an archive");
    ScriptArchiver("Total: 9\nCompressing trip/a.txt\nProgress: 50\n");
    StartOver();
  }

  // The processes of the last request and of its worker.
  void ExpectRequest(const std::string& name) {
    EXPECT_THAT(Sequence(Calls("LumoLibUmask").back().pid, true),
                ElementsAreArray(ExpectedSequence(name)));
  }
  void ExpectWorker(const std::string& name) {
    EXPECT_THAT(Sequence(Worker(), true), ElementsAreArray(ExpectedSequence(name)));
  }
};

TEST_F(SequenceTest, StartAndAJobOfOneShare) {
  // The first of the flags does not matter.
  Device::AddFault(R"(LumoLibGetPrivilege={"result":0,"level":2,"flags":1})");
  const Json::Value params =
      JobParams({"/photo/trip/a.txt", "/photo/trip/day"}, "/photo/out.zip/",
                R"({"mode":"freshen","level":"fastest","format":"zip","password":"secret"})");
  const std::string task_id = Call("start", params).data["taskid"].asString();
  ExpectRequest("start");
  ASSERT_TRUE(WaitUntil([&] { return !Calls("_exit").empty(); }));
  ExpectWorker("job_of_one_share");
  EXPECT_TRUE(Ask("status", task_id).data["finished"].asBool());
  ExpectRequest("status");
  EXPECT_EQ(Log(), Strings{});
}

TEST_F(SequenceTest, AJobOfTwoSharesThatNotifies) {
  ScriptArchiver("");
  Add("vol1/homes/alice/<z>.7z", "an archive");
  // Odd results that are no failures.
  AddFaults({"Vesk::Task::getBoolProperty=1", "KLIBGroupIsAdminGroupMem=0", "IsDirUserHome=3",
             "CheckShareListPrivilege=-1", "LumoCheckFileName=3", "VolumePathParse=3",
             "KAVOFSAclChmod=3"});
  RunJob(JobParams({"/photo/trip/a.txt", "/music", "/photo/trip/day/b.txt"}, "/home/<z>.7z",
                   R"({"format":"7z","codepage":"CP437"})"));
  ExpectWorker("job_of_two_shares");
}

TEST_F(SequenceTest, AJobThatFails) {
  RunJob(JobParams({"/photo/none"}, "/photo/<b>.zip"));
  EXPECT_THAT(After(Sequence(Worker(), true), "syslog"),
              ElementsAreArray(ExpectedSequence("failed_job")));
  EXPECT_EQ(Log(), Strings{"Can't access source files"});
}

TEST_F(SequenceTest, Stop) {
  AddFaults({"DoKill=-1", "Vesk::Task::isFinished=0"});
  const Device::Outcome started = Call("start", JobParams({"/photo/trip"}, "/photo/out.zip"));
  ASSERT_TRUE(WaitUntil([&] { return !Calls("_exit").empty(); }));
  EXPECT_EQ(Ask("stop", started.data["taskid"].asString()).code, 0);
  ExpectRequest("stop");
}

}  // namespace
