// Files, folders and programs of a test's own.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

using Strings = std::vector<std::string>;

// A folder that others can walk into; removed with all that is in it.
class TempFolder {
 public:
  TempFolder();
  ~TempFolder();
  TempFolder(const TempFolder&) = delete;
  TempFolder& operator=(const TempFolder&) = delete;

  const std::string& Path() const { return path_; }

 private:
  std::string path_;
};

std::string ReadFile(const std::string& path);
// Makes the folders above it too.
void WriteFile(const std::string& path, const std::string& text);
Strings Lines(const std::string& text);
Strings Words(const std::string& text);

// A child whose standard output the test reads. It leads its own process group, and does not
// outlive the object.
class Program {
 public:
  // Starts the program of that full path in a folder. Its standard error may go to a file.
  Program(const Strings& arguments, const std::string& folder, const std::string& errors = "");
  ~Program();
  Program(const Program&) = delete;
  Program& operator=(const Program&) = delete;

  pid_t Pid() const { return pid_; }
  const std::string& Seen() const { return seen_; }
  void CloseOutput();
  // Reads until the text has come; false when the output ends before.
  bool ReadUntil(const std::string& text);
  void ReadToEnd() { ReadUntil(std::string(1, '\0')); }
  // The exit status, or minus the signal's number.
  int Wait();

 private:
  pid_t pid_;
  int output_;
  std::string seen_;
};

// What a program printed and how it ended, as Program has it.
struct Ran {
  int status = -1;
  std::string out;
  std::string err;
};
Ran RunProgram(const Strings& arguments, const std::string& folder = "/");
