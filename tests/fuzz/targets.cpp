#include "tests/fuzz/targets.h"

#include <cstdint>
#include <cstdlib>
#include <sstream>

void FuzzArchiverCommandLine(const std::string& input);
void FuzzArchiverOutput(const std::string& input);
void FuzzDeviceConfig(const std::string& input);
void FuzzStagingList(const std::string& input);
void FuzzStartRequest(const std::string& input);
void FuzzTaskRequest(const std::string& input);

const std::vector<FuzzTarget> kFuzzTargets = {
    {"archiver_command_line", FuzzArchiverCommandLine},
    {"archiver_output", FuzzArchiverOutput},
    {"device_config", FuzzDeviceConfig},
    {"staging_list", FuzzStagingList},
    {"start_request", FuzzStartRequest},
    {"task_request", FuzzTaskRequest},
};

std::vector<std::string> SplitAt(char separator, const std::string& text) {
  std::vector<std::string> parts;
  std::istringstream stream(text + separator);
  for (std::string part; std::getline(stream, part, separator);) {
    parts.push_back(part);
  }
  return parts;
}

// libFuzzer's entry, for the target that the environment names.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const std::string name = std::getenv("KAVO_FUZZ_TARGET");
  for (const FuzzTarget& target : kFuzzTargets) {
    if (name == target.name) {
      target.run({reinterpret_cast<const char*>(data), size});
      return 0;
    }
  }
  std::abort();
}
