// What "start" refuses before there is a job, and what becomes of the task when something fails.
// The way of a request that succeeds stands in tests/sequences/start.
#include <algorithm>

#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "tests/device_fixture.h"

namespace {

using Device::Outcome;
using testing::ValuesIn;

struct Refusal {
  const char* name;
  std::string params;  // JSON
  int code;
  const char* log;   // null: no line
  const char* last;  // the last call that is as in a request that succeeds
  const char* fault = nullptr;
  const char* after = "";  // the calls between that one and the answer, but for the log's
  int version = 3;
};
void PrintTo(const Refusal& row, std::ostream* out) { *out << row.name; }

constexpr char kNoSource[] = "Bad parameter: no input source file";
constexpr char kTwoDests[] = "Bad parameter: Should not specify more than one detination path";
constexpr char kNameTooLong[] = "Bad parameter: Compress zipname too long";
constexpr char kHas[] = "KAVO::APIRequest::HasParam";
constexpr char kSplit[] = "StringExplodeEx";
constexpr char kSplitDest[] = "StringExplodeEx#2";
constexpr char kTask[] = "Vesk::Task::Task";
constexpr char kFork[] = "KLIBCProcFork";
const std::string kGood = R"({"path":"/photo/a","dest_file_path":"/photo/z","codepage":"CP437",
                              "level":"","mode":"","format":"","password":""})";

std::string Dest(const std::string& dest) {
  return R"({"path":"/photo/a","dest_file_path":")" + dest + "\"}";
}
std::string Path(const std::string& path) {
  return R"({"path":)" + path + R"(,"dest_file_path":"/photo/z"})";
}

// clang-format off
const Refusal kRefusals[] = {
    {"NoPath", R"({"dest_file_path":"/photo/a.zip"})", 101, "Bad parameter", kHas},
    {"NoDestination", R"({"path":"/photo/a"})", 101, "Bad parameter", "KAVO::APIRequest::HasParam#2"},
    {"EmptyPath", Path("\"\""), 101, kNoSource, kSplit},
    {"PathIsNumber", Path("7"), 101, kNoSource, kSplit},
    {"PathIsObject", Path("{}"), 101, kNoSource, kSplit},
    {"PathHoldsNoText", Path(R"(["/photo/a",7])"), 101, kNoSource, kSplit},
    {"PathHoldsZeroByte", Path(R"("/photo/a\u0000b")"), 101, kNoSource, kSplit},
    {"BrokenArray", Path(R"("[\"/photo/a\"")"), 101, kNoSource, kSplit},
    {"TwoDestinations", Dest("/photo/b,/photo/c"), 101, kTwoDests, kSplitDest},
    {"CommaInFirstVersion", Dest(R"([\"/photo/b,c.zip\"])"), 101, kTwoDests, kSplitDest, nullptr, "", 1},
    {"NoDestinationLeft", Dest(","), 101, kTwoDests, kSplitDest},
    {"NameOf256Bytes", Dest("/photo/" + std::string(256, 'n')), 1301, kNameTooLong, kSplitDest},
    {"NameOf256BytesAndSlashes", Dest("/photo/" + std::string(256, 'n') + "//"), 1301, kNameTooLong, kSplitDest},
    {"NoUniqueId", Dest("/photo/" + std::string(255, 'n') + "/"), 401, nullptr,
     "Vesk::TaskMgr::getUniqueTaskId", "Vesk::TaskMgr::getUniqueTaskId=throw"},
    {"NoTask", kGood, 401, nullptr, kTask, "Vesk::Task::Task=throw"},
    {"NoFork", kGood, 1300, "Failed to fork().", kFork, "KLIBCProcFork=-1", "Vesk::Task::remove"},
    {"UpdateNotStored", kGood, 1300, "Failed to write progress.", "Vesk::Task::endUpdate", "Vesk::Task::endUpdate=0"},
};
// clang-format on

class StartRefuses : public DeviceTest, public testing::WithParamInterface<Refusal> {};

TEST_P(StartRefuses, WithItsCodeAndLineAndNoFurtherCall) {
  const Refusal& row = GetParam();
  // A worker is not to wait for data that never comes.
  Device::AddFault("WaitForTaskDataReady=0");
  if (row.fault != nullptr) {
    Device::AddFault(row.fault);
  }
  const Outcome outcome = Call("start", Device::ParseJson(row.params), "alice", row.version);
  EXPECT_EQ(outcome.code, row.code);
  EXPECT_TRUE(outcome.data.isNull());

  const int pid = Calls("LumoLibUmask").front().pid;
  Strings expected = NamesOf(ExpectedSequence("start"));
  if (row.params.find("codepage") != std::string::npos) {
    // The user's settings are not asked, and the worker's data holds one parameter more.
    expected.erase(
        std::find(expected.begin(), expected.end(), "KavoSettings::loadUserJsonSettings"));
    expected.insert(std::find(expected.begin(), expected.end(), "LumoLibBkgTaskInfoCreate"),
                    "KAVO::APIRequest::GetParam");
  }
  expected =
      UpTo(expected, row.last) + Words(row.after) + Words(row.log == nullptr ? "" : "syslog");
  EXPECT_EQ(Sequence(pid), expected + Words("KAVO::APIResponse::SetError LumoLibRestoreUmask"));
  const Strings log = Log();  // a worker's lines may be among them
  EXPECT_EQ(std::count(log.begin(), log.end(), row.log == nullptr ? "" : row.log),
            row.log == nullptr ? 0 : 1);
  EXPECT_EQ(log.empty(), row.log == nullptr);
}

INSTANTIATE_TEST_SUITE_P(Start, StartRefuses, ValuesIn(kRefusals),
                         [](const auto& row) { return row.param.name; });

class StartTest : public DeviceTest {};

TEST_F(StartTest, LeavesNoTaskWhenItCannotFork) {
  Device::AddFault("KLIBCProcFork=-1");
  Call("start", JobParams({"/photo/a"}, "/photo/z.zip"));
  const std::string task_id = Calls("Vesk::TaskMgr::getUniqueTaskId").front().result.asString();
  EXPECT_EQ(Ask("status", task_id).code, 599);
}

TEST_F(StartTest, AnswersThoughTheDataWasNotStored) {
  Device::AddFault("WaitForTaskDataReady=0");
  Device::AddFault("Vesk::Task::setProperty#2=0");
  EXPECT_EQ(Call("start", JobParams({"/photo/a"}, "/photo/z.zip")).code, 0);
  const Strings log = Log();  // the worker's lines are among them
  EXPECT_EQ(std::count(log.begin(), log.end(), "Failed to write progress."), 1);
  EXPECT_EQ(Calls("Vesk::Task::endUpdate").size(), 1U);
}

TEST_F(StartTest, AValueThatIsNoTextPassesThroughAsAnException) {
  Json::Value params = JobParams({"/photo/a"}, "/photo/z.zip");
  params["codepage"] = Json::Value(Json::objectValue);
  EXPECT_EQ(Call("start", params).code, 101);
  EXPECT_TRUE(Calls("KAVO::APIResponse::SetError").empty());
  EXPECT_EQ(Log(), Strings{"start: Type is not convertible to string"});
}

TEST_F(StartTest, StoresParametersAsTheyWereGiven) {
  Json::Value params = JobParams({"/photo/a,b", "/photo/c"}, "/photo/z.zip/");
  params["level"] = 5;
  params["codepage"] = Json::Value();
  const Outcome outcome = Call("start", params, "bob", 2);
  const Json::Value data = Calls("LumoLibBkgTaskInfoCreate").front().args[0];
  EXPECT_EQ(data["pid"], Fork().result);
  EXPECT_EQ(data["version"], 2);
  EXPECT_EQ(data["params"], Device::ParseJson(R"({"codepage":null,"dest_file_path":"/photo/z.zip/",
                                                  "level":5,"path":["/photo/a,b","/photo/c"]})"));
  EXPECT_TRUE(data.isMember(outcome.data["taskid"].asString()));
}

TEST_F(StartTest, TakesTheCodepageOfTheRequestOrElseOfTheUser) {
  Add("vol1/photo/a", "a");
  const auto codepage_of = [&](const Json::Value& params, const std::string& user) {
    Watch();
    RunJob(params, user);
    return Calls("KLIBCPopenv").front().args[2][6].asString();
  };
  Json::Value params = JobParams({"/photo/a"}, "/photo/z.zip");
  EXPECT_EQ(codepage_of(params, "bob"), "-langCP932");
  EXPECT_EQ(codepage_of(params, "alice"), "-lang");
  params["codepage"] = "CP437";
  EXPECT_EQ(codepage_of(params, "bob"), "-langCP437");
}

}  // namespace
