// Every input in tests/corpus, through its target.
#include <gtest/gtest.h>

#include <filesystem>

#include "device/base/file_io.h"
#include "tests/fuzz/targets.h"

void PrintTo(const FuzzTarget& target, std::ostream* out) { *out << target.name; }

namespace {

class CorpusTest : public testing::TestWithParam<FuzzTarget> {};

TEST_P(CorpusTest, EachInputKeepsTheProperties) {
  const std::filesystem::path folder = std::filesystem::path(KAVO_CORPUS) / GetParam().name;
  EXPECT_FALSE(std::filesystem::is_empty(folder));
  for (const auto& entry : std::filesystem::directory_iterator(folder)) {
    EXPECT_NO_THROW(GetParam().run(Device::ReadTextFile(entry.path()))) << entry.path();
  }
}

INSTANTIATE_TEST_SUITE_P(Fuzz, CorpusTest, testing::ValuesIn(kFuzzTargets),
                         testing::PrintToStringParamName());

}  // namespace
