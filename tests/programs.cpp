#include "tests/programs.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <utility>

namespace fs = std::filesystem;

TempFolder::TempFolder() {
  char name[] = "/tmp/kavo-test-XXXXXX";
  path_ = mkdtemp(name);
  chmod(path_.c_str(), 0755);
}

TempFolder::~TempFolder() {
  std::error_code ignored;
  fs::remove_all(path_, ignored);
}

std::string ReadFile(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  std::ostringstream text;
  text << file.rdbuf();
  return text.str();
}

void WriteFile(const std::string& path, const std::string& text) {
  fs::create_directories(fs::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << text;
}

Strings Lines(const std::string& text) {
  std::istringstream in(text);
  Strings lines;
  for (std::string line; std::getline(in, line);) {
    lines.push_back(line);
  }
  return lines;
}

Strings Words(const std::string& text) {
  std::istringstream in(text);
  return {std::istream_iterator<std::string>(in), {}};
}

Program::Program(const Strings& arguments, const std::string& folder,
                 const std::function<void()>& prepare) {
  std::array<int, 2> ends{};
  if (pipe2(ends.data(), O_CLOEXEC) != 0) {
    std::abort();
  }
  std::vector<char*> pointers;
  for (const std::string& argument : arguments) {
    pointers.push_back(const_cast<char*>(argument.c_str()));
  }
  pointers.push_back(nullptr);
  // Opened before `prepare`, after which there may be no way to walk there.
  const int program = open(pointers[0], O_PATH | O_CLOEXEC);
  pid_ = fork();
  if (pid_ == 0) {
    setpgid(0, 0);
    dup2(ends[1], STDOUT_FILENO);
    prepare();
    if (chdir(folder.c_str()) == 0) {
      fexecve(program, pointers.data(), environ);
      execv(pointers[0], pointers.data());  // a script is read again by its name
    }
    _exit(126);
  }
  setpgid(pid_, pid_);
  close(program);
  close(ends[1]);
  output_ = ends[0];
}

Program::~Program() {
  if (pid_ > 0) {
    kill(pid_, SIGKILL);
    Wait();
  }
  CloseOutput();
}

void Program::CloseOutput() {
  if (output_ >= 0) {
    close(std::exchange(output_, -1));
  }
}

bool Program::ReadUntil(const std::string& text) {
  std::array<char, 4096> block{};
  while (seen_.find(text) == std::string::npos) {
    const ssize_t size = read(output_, block.data(), block.size());
    if (size <= 0) {
      return false;
    }
    seen_.append(block.data(), static_cast<std::size_t>(size));
  }
  return true;
}

int Program::Wait() {
  int status = 0;
  waitpid(std::exchange(pid_, -1), &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

Ran RunProgram(const Strings& arguments, const std::string& folder) {
  const TempFolder temp;
  const std::string err_path = temp.Path() + "/err";
  Program program(arguments, folder,
                  [&] { dup2(open(err_path.c_str(), O_WRONLY | O_CREAT, 0600), STDERR_FILENO); });
  program.ReadToEnd();
  const int status = program.Wait();
  return {status, program.Seen(), ReadFile(err_path)};
}

Tree Unpacked(const std::string& archive, const std::string& password) {
  const TempFolder to;
  const Ran ran = RunProgram({"/usr/bin/7z", "x", "-spd", "-snld20", "-bso0", "-bsp0",
                              "-p" + password, "-o" + to.Path(), archive});
  EXPECT_EQ(ran.status, 0) << ran.err;
  if (ReadFile(archive).substr(0, 2) == "PK") {
    const Ran tested = RunProgram({"/usr/bin/unzip", "-tqq", "-P", password, archive});
    EXPECT_EQ(tested.status, 0) << tested.out << tested.err;
  }
  Tree tree;
  for (const auto& entry : fs::recursive_directory_iterator(to.Path())) {
    tree[entry.path().lexically_relative(to.Path())] =
        entry.is_symlink()     ? "-> " + fs::read_symlink(entry.path()).string()
        : entry.is_directory() ? "/"
                               : ReadFile(entry.path());
  }
  return tree;
}
