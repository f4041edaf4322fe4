// Every input in tests/corpus, through its target.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>

#include "tests/fuzz/targets.h"

void PrintTo(const FuzzTarget& target, std::ostream* out) { *out << target.name; }

namespace {

class CorpusTest : public testing::TestWithParam<FuzzTarget> {};

TEST_P(CorpusTest, EachInputKeepsTheTargetsProperties) {
  const std::filesystem::path folder = std::filesystem::path(KAVO_CORPUS) / GetParam().name;
  EXPECT_FALSE(std::filesystem::is_empty(folder));
  for (const auto& entry : std::filesystem::directory_iterator(folder)) {
    std::ifstream file(entry.path(), std::ios::binary);
    const std::string input{std::istreambuf_iterator<char>(file), {}};
    EXPECT_NO_THROW(GetParam().run(input)) << entry.path();
  }
}

INSTANTIATE_TEST_SUITE_P(Fuzz, CorpusTest, testing::ValuesIn(kFuzzTargets),
                         [](const auto& target) { return std::string(target.param.name); });

}  // namespace
