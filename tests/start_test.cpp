// What "start" refuses before there is a job, and what it stores when there is one.
#include <algorithm>

#include "device/bodies/json_text.h"
#include "device/bodies/operations.h"
#include "tests/device_fixture.h"

namespace {

using Device::Outcome;
using testing::Values;

struct Refusal {
  const char* name;
  const char* params;  // JSON
  int code;
  const char* log;  // empty: no line
  int version = 3;
};
void PrintTo(const Refusal& row, std::ostream* out) { *out << row.name; }

class StartRefuses : public DeviceTest, public testing::WithParamInterface<Refusal> {};

TEST_P(StartRefuses, BeforeATaskExists) {
  const Refusal& row = GetParam();
  const Outcome outcome = Call("start", Device::ParseJson(row.params), "alice", row.version);
  EXPECT_EQ(outcome.code, row.code);
  EXPECT_TRUE(outcome.data.isNull());
  const std::vector<std::string> log = Log();
  EXPECT_EQ(log.empty() ? "" : log.back(), row.log);
  EXPECT_TRUE(Calls("Vesk::Task::Task").empty());
  EXPECT_TRUE(Calls("KLIBCProcFork").empty());
}

constexpr char kTwoDestinations[] =
    "Bad parameter: Should not specify more than one detination path";
constexpr char kNoSource[] = "Bad parameter: no input source file";
const std::string kName256 =
    R"({"path":"/photo/a","dest_file_path":"/photo/)" + std::string(256, 'n') + "\"}";
const std::string kLongWord =
    R"({"path":"[)" + std::string(1 << 20, '1') + R"(x]","dest_file_path":"/photo/z"})";

INSTANTIATE_TEST_SUITE_P(
    Parameters, StartRefuses,
    Values(Refusal{"NoPath", R"({"dest_file_path":"/photo/a.zip"})", 101, "Bad parameter"},
           Refusal{"NoDestination", R"({"path":"/photo/a"})", 101, "Bad parameter"},
           Refusal{"EmptyPath", R"({"path":"","dest_file_path":"/photo/a.zip"})", 101, kNoSource},
           Refusal{"PathIsNumber", R"({"path":7,"dest_file_path":"/photo/a.zip"})", 101, kNoSource},
           Refusal{"PathIsObject", R"({"path":{},"dest_file_path":"/photo/a.zip"})", 101,
                   kNoSource},
           Refusal{"PathHoldsNoText", R"({"path":["/photo/a",7],"dest_file_path":"/photo/a.zip"})",
                   101, kNoSource},
           Refusal{"PathHoldsZeroByte", R"({"path":"/photo/a\u0000b","dest_file_path":"/photo/z"})",
                   101, kNoSource},
           Refusal{"BrokenArray", R"({"path":"[\"/photo/a\"","dest_file_path":"/photo/z"})", 101,
                   kNoSource},
           Refusal{"BrokenArrayWithALongWord", kLongWord.c_str(), 101, kNoSource},
           Refusal{"TwoDestinations", R"({"path":"/photo/a","dest_file_path":"/photo/b,/photo/c"})",
                   101, kTwoDestinations},
           Refusal{"CommaInFirstVersion",
                   R"({"path":"/photo/a","dest_file_path":"[\"/photo/b,c.zip\"]"})", 101,
                   kTwoDestinations, 1},
           Refusal{"NoDestinationLeft", R"({"path":"/photo/a","dest_file_path":","})", 101,
                   kTwoDestinations},
           Refusal{"NameOf256Bytes", kName256.c_str(), 1301,
                   "Bad parameter: Compress zipname too long"},
           Refusal{"CodepageIsObject",
                   R"({"path":"/photo/a","dest_file_path":"/photo/z","codepage":{}})", 101,
                   "start: Type is not convertible to string"}),
    [](const auto& row) { return row.param.name; });

class StartTest : public DeviceTest {};

TEST_F(StartTest, FailsWithoutLogWhenNoTaskCanBeMade) {
  Add("vol1/photo/a", "a");
  for (const char* rule : {"Vesk::TaskMgr::getUniqueTaskId=throw", "Vesk::Task::Task=throw"}) {
    Device::StopWatching();
    Device::AddFault(rule);
    Device::OpenTrace(temp_.Path() + "/trace");
    EXPECT_EQ(Call("start", JobParams({"/photo/a"}, "/photo/z.zip")).code, 401) << rule;
  }
  EXPECT_TRUE(Log().empty());
  EXPECT_TRUE(Calls("KLIBCProcFork").empty());
}

TEST_F(StartTest, RemovesTheTaskWhenItCannotFork) {
  Device::AddFault("KLIBCProcFork=-1");
  EXPECT_EQ(Call("start", JobParams({"/photo/a"}, "/photo/z.zip")).code, 1300);
  EXPECT_EQ(Log(), std::vector<std::string>{"Failed to fork()."});
  EXPECT_EQ(Calls("Vesk::Task::remove").size(), 1U);
  const std::string task_id = Calls("Vesk::TaskMgr::getUniqueTaskId").front().result.asString();
  EXPECT_EQ(Ask("status", task_id).code, 599);
}

TEST_F(StartTest, AnswersWhetherTheTaskWasStored) {
  // The worker is not to wait for data that never comes.
  Device::AddFault("WaitForTaskDataReady=0");
  Device::AddFault("Vesk::Task::setProperty#2=0");
  EXPECT_EQ(Call("start", JobParams({"/photo/a"}, "/photo/z.zip")).code, 0);
  const std::vector<std::string> log = Log();
  EXPECT_EQ(std::count(log.begin(), log.end(), "Failed to write progress."), 1);
  Device::AddFault("Vesk::Task::endUpdate=0");
  EXPECT_EQ(Call("start", JobParams({"/photo/a"}, "/photo/z.zip")).code, 1300);
}

TEST_F(StartTest, StoresTheRequestInOneBracket) {
  Json::Value params = JobParams({"/photo/a,b", "/photo/c"}, "/photo/z.zip/");
  params["password"] = "secret";
  params["level"] = 5;
  const Outcome outcome = Call("start", params);
  ASSERT_EQ(outcome.code, 0);
  const std::string task_id = outcome.data["taskid"].asString();
  EXPECT_EQ(task_id.rfind("Zantro_", 0), 0U);

  const int parent = Fork().pid;
  std::vector<std::string> bracket;
  Json::Value data;
  for (const TracedCall& call : Calls()) {
    if (call.pid == parent &&
        (call.call == "Vesk::Task::beginUpdate" || call.call == "Vesk::Task::setProperty" ||
         call.call == "Vesk::Task::endUpdate")) {
      bracket.push_back(call.call + (call.args.empty() ? "" : " " + call.args[0].asString()));
      data = call.args[0] == "data" ? call.args[1] : data;
    }
  }
  EXPECT_EQ(bracket,
            (std::vector<std::string>{"Vesk::Task::beginUpdate", "Vesk::Task::setProperty progress",
                                      "Vesk::Task::setProperty data", "Vesk::Task::endUpdate"}));
  EXPECT_EQ(data["api"], "KAVO.Zantro.Compress");
  EXPECT_EQ(data["method"], "start");
  EXPECT_EQ(data["version"], 3);
  EXPECT_EQ(data["taskid"], task_id);
  EXPECT_EQ(data["pid"], Fork().result);
  EXPECT_EQ(data["params"]["path"], Device::ParseJson(R"(["/photo/a,b","/photo/c"])"));
  EXPECT_EQ(data["params"]["dest_file_path"], "/photo/z.zip/");
  EXPECT_EQ(data["params"]["password"], "secret");
  EXPECT_EQ(data["params"]["level"], 5);
  EXPECT_FALSE(data["params"].isMember("mode"));
  EXPECT_TRUE(data[task_id].isObject());
  // The info is made from data that holds its key already.
  const TracedCall info = Calls("LumoLibBkgTaskInfoCreate").front();
  EXPECT_TRUE(info.args[0].isMember(task_id) && info.args[0][task_id].isNull());
  EXPECT_EQ(info.args[1], "compress");
}

TEST_F(StartTest, TakesTheCodepageOfTheRequestOrElseOfTheUser) {
  Add("vol1/photo/a", "a");
  const auto codepage_of = [&](const Json::Value& params, const std::string& user) {
    Device::StopWatching();
    std::remove((temp_.Path() + "/trace").c_str());
    Device::OpenTrace(temp_.Path() + "/trace");
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
