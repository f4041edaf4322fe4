#ifndef TESTS_ARCHIVER_TEST_SUPPORT_H_
#define TESTS_ARCHIVER_TEST_SUPPORT_H_

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <map>
#include <optional>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "tests/programs.h"

namespace ArchiverTest {

namespace fs = std::filesystem;

struct Outcome {
  int status;
  std::string text;
  Strings lines;

  std::string Last() const { return lines.empty() ? "" : lines.back(); }
  long Count(const std::string& start) const {
    return std::count_if(lines.begin(), lines.end(),
                         [&](const std::string& l) { return l.rfind(start, 0) == 0; });
  }
};

inline Outcome Execute(
    const Strings& argv, const fs::path& folder, const std::function<void()>& prepare = [] {}) {
  const Ran ran = RunProgram(argv, folder, prepare);
  return {ran.status, ran.out, Lines(ran.out)};
}

struct Options {
  std::string command = "a", actions, level, password;
  const char* code_page = nullptr;  // set for a zip
};

// Shares to pack from, a folder for archives and the caller's list file, all of the test's own.
class ArchiverFixture : public testing::Test {
 protected:
  void SetUp() override {
    root = temp_.emplace().Path();
    fs::permissions(root, fs::perms::all);
    folder = share = root / "share";
    out = root / "out";
    list = root / "list";
    fs::create_directories(share);
    fs::create_directories(out);
  }
  void TearDown() override { temp_.reset(); }

  Strings CommandLine(const fs::path& archive, const Strings& sources,
                      const Options& options = {}) {
    std::string text;
    for (const std::string& source : sources) {
      text += "./" + source + '\n';
    }
    WriteFile(list, text);
    Strings argv = {KAVO_7Z_PATH, options.command, "-utf16",
                    archive,      options.actions, options.level};
    if (options.code_page != nullptr) {
      argv.push_back(std::string("-lang") + options.code_page);
    }
    if (!options.password.empty()) {
      argv.push_back("-p" + options.password);
    }
    argv.insert(argv.end(), {"-xr!@eaDir", "@" + list.string(), "-progress"});
    return argv;
  }
  Outcome Pack(const fs::path& archive, const Strings& sources, const Options& options = {}) {
    return Execute(CommandLine(archive, sources, options), folder);
  }
  // Files, links ("-> target") and folders ("/") that the archive unpacks to.
  std::map<std::string, std::string> Unpacked(const fs::path& archive,
                                              const std::string& password = "none") {
    const fs::path to = root / "unpacked";
    fs::remove_all(to);
    EXPECT_EQ(Execute({"/usr/bin/7z", "x", "-y", "-spd", "-snld20", "-bsp0", "-bso0",
                       "-p" + password, "-o" + to.string(), archive},
                      root)
                  .status,
              0);
    fs::create_directories(to);
    std::map<std::string, std::string> found;
    for (const auto& entry : fs::recursive_directory_iterator(to)) {
      found[entry.path().lexically_relative(to)] =
          entry.is_symlink()     ? "-> " + fs::read_symlink(entry.path()).string()
          : entry.is_directory() ? "/"
                                 : ReadFile(entry.path());
    }
    return found;
  }
  Strings Names(const fs::path& archive) {
    Strings names;
    for (const auto& entry : Unpacked(archive)) {
      names.push_back(entry.first);
    }
    return names;
  }
  Strings InOut() {
    Strings names;
    for (const auto& entry : fs::directory_iterator(out)) {
      names.push_back(entry.path().filename());
    }
    std::sort(names.begin(), names.end());
    return names;
  }

  fs::path root, share, out, list;
  fs::path folder;  // where the archiver is started

 private:
  std::optional<TempFolder> temp_;
};

}  // namespace ArchiverTest

#endif  // TESTS_ARCHIVER_TEST_SUPPORT_H_
