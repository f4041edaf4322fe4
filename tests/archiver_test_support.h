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
#include <sstream>
#include <string>
#include <utility>
#include <vector>

namespace ArchiverTest {

namespace fs = std::filesystem;
using Strings = std::vector<std::string>;

inline std::string ReadFile(const fs::path& path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

inline void WriteFile(const fs::path& path, const std::string& text) {
  fs::create_directories(path.parent_path());
  std::ofstream(path, std::ios::binary) << text;
}

// A child whose standard output the test reads. It leads its own process group.
class Program {
 public:
  Program(
      const Strings& argv, const fs::path& folder, const std::function<void()>& prepare = [] {}) {
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) {
      std::abort();
    }
    std::vector<char*> pointers;
    for (const std::string& argument : argv) {
      pointers.push_back(const_cast<char*>(argument.c_str()));
    }
    pointers.push_back(nullptr);
    // Opened before `prepare`, after which there may be no way to walk there.
    const int program = open(argv[0].c_str(), O_PATH | O_CLOEXEC);
    pid_ = fork();
    if (pid_ == 0) {
      setpgid(0, 0);
      dup2(ends[1], STDOUT_FILENO);
      prepare();
      if (chdir(folder.c_str()) == 0) {
        fexecve(program, pointers.data(), environ);
        execv(argv[0].c_str(), pointers.data());  // a script is read again by its name
      }
      _exit(126);
    }
    setpgid(pid_, pid_);
    close(program);
    close(ends[1]);
    output_ = ends[0];
  }
  Program(const Program&) = delete;
  Program& operator=(const Program&) = delete;
  ~Program() {
    if (pid_ > 0) {
      kill(pid_, SIGKILL);
      Wait();
    }
    CloseOutput();
  }

  pid_t Pid() const { return pid_; }
  const std::string& Seen() const { return seen_; }
  void CloseOutput() {
    if (output_ >= 0) {
      close(std::exchange(output_, -1));
    }
  }
  // Reads until `text` has come; false when the output ends before.
  bool ReadUntil(const std::string& text) {
    char buffer[4096];
    while (seen_.find(text) == std::string::npos) {
      const ssize_t size = read(output_, buffer, sizeof buffer);
      if (size <= 0) {
        return false;
      }
      seen_.append(buffer, static_cast<size_t>(size));
    }
    return true;
  }
  // The exit status, or minus the signal's number.
  int Wait() {
    int status = 0;
    waitpid(std::exchange(pid_, -1), &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  }

 private:
  pid_t pid_;
  int output_;
  std::string seen_;
};

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
  Program program(argv, folder, prepare);
  program.ReadUntil(std::string(1, '\0'));
  Outcome outcome{program.Wait(), program.Seen(), {}};
  std::istringstream in(outcome.text);
  for (std::string line; std::getline(in, line);) {
    outcome.lines.push_back(line);
  }
  return outcome;
}

struct Options {
  std::string command = "a", actions, level, password;
  const char* code_page = nullptr;  // set for a zip
};

// Shares to pack from, a folder for archives and the caller's list file, all of the test's own.
class ArchiverFixture : public testing::Test {
 protected:
  void SetUp() override {
    std::string path = fs::temp_directory_path() / "archiver_test_XXXXXX";
    ASSERT_NE(mkdtemp(path.data()), nullptr);
    root = path;
    fs::permissions(root, fs::perms::all);
    folder = share = root / "share";
    out = root / "out";
    list = root / "list";
    fs::create_directories(share);
    fs::create_directories(out);
  }
  void TearDown() override { fs::remove_all(root); }

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
};

}  // namespace ArchiverTest

#endif  // TESTS_ARCHIVER_TEST_SUPPORT_H_
