#include "tests/programs.h"

#include <fcntl.h>
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
  path_ = fs::temp_directory_path() / "kavo-test-XXXXXX";
  path_ = mkdtemp(path_.data());
  chmod(path_.c_str(), 0755);
}

TempFolder::~TempFolder() {
  std::error_code ignored;
  fs::remove_all(path_, ignored);
}

std::string ReadFile(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
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

Program::Program(const Strings& arguments, const std::string& folder, const std::string& errors) {
  std::array<int, 2> ends{};
  if (pipe2(ends.data(), O_CLOEXEC) != 0) {
    std::abort();
  }
  std::vector<char*> pointers;
  for (const std::string& argument : arguments) {
    pointers.push_back(const_cast<char*>(argument.c_str()));
  }
  pointers.push_back(nullptr);
  pid_ = fork();
  if (pid_ == 0) {
    setpgid(0, 0);
    dup2(ends[1], STDOUT_FILENO);
    if (!errors.empty()) {
      dup2(open(errors.c_str(), O_WRONLY | O_CREAT, 0600), STDERR_FILENO);
    }
    if (chdir(folder.c_str()) == 0) {
      execve(pointers[0], pointers.data(), environ);
    }
    _exit(126);
  }
  setpgid(pid_, pid_);
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
  Program program(arguments, folder, temp.Path() + "/err");
  program.ReadToEnd();
  const int status = program.Wait();
  return {status, program.Seen(), ReadFile(temp.Path() + "/err")};
}
