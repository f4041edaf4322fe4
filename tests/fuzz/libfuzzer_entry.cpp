#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "tests/fuzz/targets.h"

// Runs the target that the environment names.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const char* const name = std::getenv("KAVO_FUZZ_TARGET");
  for (const FuzzTarget& target : kFuzzTargets) {
    if (name != nullptr && std::strcmp(name, target.name) == 0) {
      target.run({reinterpret_cast<const char*>(data), size});
      return 0;
    }
  }
  std::abort();
}
