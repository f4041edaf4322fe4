// The module as its host sees it: symbols, table, one outcome per request.
#include <dlfcn.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <regex>
#include <set>

#include "device/platform/operations.h"
#include "tests/device_fixture.h"

// Null without the leak checker.
extern "C" int __lsan_do_recoverable_leak_check() __attribute__((weak));  // NOLINT

namespace {

using Device::Outcome;
using KAVO::ApiRow;

// The names of the module's dynamic symbols without a version, without their arguments.
std::set<std::string> Symbols(const std::string& which) {
  std::set<std::string> names;
  for (const std::string& line :
       Lines(RunProgram({"/usr/bin/nm", "-DCj", which, ModulePath()}).out)) {
    if (line.find('@') == line.npos) {
      names.insert(line.substr(0, line.find_first_of("([")));
    }
  }
  return names;
}

// Symbols of the sanitizer would stand among them.
#if !defined(__SANITIZE_ADDRESS__)
TEST(ModuleSymbols, ThreeAreExportedAndThePlatformAloneIsLeftToTheHost) {
  EXPECT_EQ(Symbols("--defined-only"), (std::set<std::string>{"GetAPITable", "gTable", "pTask"}));
  std::set<std::string> expected = {"Vesk::Task::~Task", "Vesk::TaskMgr::~TaskMgr",
                                    "KavoSettings::~KavoSettings"};
  const auto operations = Device::OperationNames();
  expected.insert(operations.begin(), operations.end());
  std::set<std::string> undefined;
  for (const std::string& name : Symbols("--undefined-only")) {
    static const std::regex kLibraries("_ITM_.*|__gmon_start__|Json::.*");
    if (!std::regex_match(name, kLibraries)) {
      undefined.insert(name);
    }
  }
  EXPECT_EQ(undefined, expected);
}

#endif

class ApiTest : public DeviceTest {
 protected:
  ApiTest() : module_(dlopen(ModulePath().c_str(), RTLD_NOW), dlclose) {}

  void* Symbol(const char* name) const { return dlsym(module_.get(), name); }

  std::unique_ptr<void, int (*)(void*)> module_;
};

TEST_F(ApiTest, TableListsEachMethodOfEachVersionAndEnds) {
  auto* const get_table = reinterpret_cast<void* (*)()>(Symbol("GetAPITable"));
  const auto* const rows = static_cast<const ApiRow*>(get_table());
  EXPECT_EQ(rows, Symbol("gTable"));
  const char* const methods[] = {"start", "status", "stop"};
  for (int row = 0; row < 9; ++row) {
    EXPECT_STREQ(rows[row].api, "KAVO.Zantro.Compress");
    EXPECT_EQ(rows[row].version, 1 + row / 3);
    EXPECT_STREQ(rows[row].method, methods[row % 3]);
    EXPECT_EQ(rows[row].handler, rows[0].handler);
  }
  const ApiRow end = {};
  EXPECT_EQ(std::memcmp(&rows[9], &end, sizeof end), 0);
}

TEST_F(ApiTest, HostRefusesWhatNoRowServes) {
  EXPECT_EQ(Call("begin", {}).code, 103);
  EXPECT_EQ(Call("status", {}, "alice", 4).code, 104);
  EXPECT_TRUE(Calls().empty());
}

// A request that fails early must not free the task of the one before it.
TEST_F(ApiTest, OneProcessImageServesManyRequestsAlike) {
  Add("vol1/photo/a.txt", "a");
  Device::StopTracing();
  const auto serve = [&](const std::string& method, const Json::Value& params, int code) {
    const Outcome outcome = launcher_->CallHere(MakeRequest(method, params));
    EXPECT_EQ(outcome.code, code) << method;
    return outcome.data;
  };
  const pid_t pid = fork();  // it takes on alice's identity for good
  if (pid == 0) {
    Json::Value unknown;
    unknown["taskid"] = "Zantro_none";
    for (int round = 0; round < 34; ++round) {
      const Json::Value task = serve("start", JobParams({"/photo/a.txt"}, "/photo/z.zip"), 0);
      serve("status", Json::objectValue, 101);
      serve("status", unknown, 599);
      serve("stop", task, 0);
      serve("status", task, 599);
      Device::Launcher::Reap();
    }
    if (__lsan_do_recoverable_leak_check != nullptr) {
      prctl(PR_SET_DUMPABLE, 1);  // for the leak checker to look into it
      EXPECT_EQ(__lsan_do_recoverable_leak_check(), 0);
    }
    _exit(HasFailure() ? 1 : 0);
  }
  int status = 0;
  ASSERT_EQ(waitpid(pid, &status, 0), pid);
  EXPECT_EQ(status, 0);
}

}  // namespace
