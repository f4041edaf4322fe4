// The archiver as a program.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <memory>

#include "tests/programs.h"

namespace fs = std::filesystem;

struct Options {
  std::string command = "a", actions, password;
  const char* code_page = nullptr;  // set for a zip
};

// A share to pack from, a folder for archives and the caller's list file, all of the test's own.
class ArchiverTest : public testing::Test {
 protected:
  ArchiverTest() {
    WriteFile(share / "a", "a");
    fs::create_directories(out);
  }

  Strings CommandLine(const std::string& archive, const Strings& sources, const Options& options) {
    std::string list;
    for (const std::string& source : sources) {
      list += "./" + source + '\n';
    }
    WriteFile(root / "list", list);
    Strings argv = {KAVO_7Z_PATH, options.command, "-utf16", out / archive, options.actions, ""};
    if (options.code_page != nullptr) {
      argv.push_back(std::string("-lang") + options.code_page);
    }
    if (!options.password.empty()) {
      argv.push_back("-p" + options.password);
    }
    argv.insert(argv.end(), {"-xr!@eaDir", "@" + (root / "list").string(), "-progress"});
    return argv;
  }

  Strings Good(const std::string& archive, const Strings& sources, const Options& options = {}) {
    const Ran ran = RunProgram(CommandLine(archive, sources, options), share);
    Strings lines = Lines(ran.out);
    EXPECT_EQ(ran.status, 0) << ran.out;
    EXPECT_EQ(lines.back(), "Progress: 100");
    for (const std::string& line : lines) {
      EXPECT_TRUE(line.find("Error:") == line.npos || line.rfind("Compressing ", 0) == 0) << line;
    }
    return lines;
  }

  void Bad(const std::string& archive, const Strings& sources, const std::string& cause,
           const Options& options = {}) {
    const Ran ran = RunProgram(CommandLine(archive, sources, options), share);
    EXPECT_NE(ran.status, 0);
    const std::string last = Lines(ran.out).back();
    EXPECT_EQ(last.rfind("Error: ", 0), 0U) << ran.out;
    EXPECT_NE(last.find(cause), std::string::npos) << ran.out;
    EXPECT_EQ(ran.out.find("Error:"), ran.out.rfind("Error:")) << ran.out;
    EXPECT_EQ(ran.out.find("Progress: 100"), std::string::npos);
  }

  // A run that packs a sparse file of that size, to "new".
  std::unique_ptr<Program> Pack(const Options& options = {}, std::uintmax_t size = kHuge) {
    WriteFile(share / "huge", "");
    fs::resize_file(share / "huge", size);
    auto run = std::make_unique<Program>(CommandLine("new", {"huge"}, options), share);
    EXPECT_TRUE(run->ReadUntil("Progress: 0\n")) << run->Seen();
    return run;
  }

  Strings InOut() {
    Strings names;
    for (const auto& entry : fs::directory_iterator(out)) {
      names.push_back(entry.path().filename());
    }
    std::sort(names.begin(), names.end());
    return names;
  }

  static constexpr std::uintmax_t kHuge = 5ULL << 30U;  // it takes seconds to pack
  const TempFolder temp;
  const fs::path root = temp.Path(), share = root / "share", out = root / "out";
};
