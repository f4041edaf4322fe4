#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <ctime>
#include <memory>
#include <optional>

#include "device/base/child_process.h"
#include "device/base/code_page.h"
#include "device/base/json_text.h"
#include "device/base/open_below.h"
#include "device/base/shortage.h"
#include "device/base/utf8.h"
#include "device/host/user_files.h"
#include "device/model/device.h"

namespace Device {

namespace {

constexpr std::int64_t kMostEntries = 10000;

// "zip" or "7z"; empty for anything else, of which 7z knows a lot.
std::string FormatOf(const FileDescriptor& file) {
  std::array<char, 4> bytes{};
  const ssize_t size = pread(file.Get(), bytes.data(), bytes.size(), 0);
  const std::string begin(bytes.data(), size < 0 ? 0 : static_cast<std::size_t>(size));
  return begin == "7z\xBC\xAF" ? "7z" : begin == "PK\x03\x04" || begin == "PK\x05\x06" ? "zip" : "";
}

// Seconds that local time is ahead of UTC now. 7z shifts all times by it, those of another season
// too.
long OffsetOfToday() {
  const std::time_t now = std::time(nullptr);
  std::tm local{};
  return localtime_r(&now, &local)->tm_gmtoff;
}

// What 7z tells of one entry after the other, in lines "KEY = VALUE".
class Contents {
 public:
  // Names that are no UTF-8, as in zips made elsewhere, are read in the user's code page.
  explicit Contents(const std::string& user)
      : code_page_(CodePage::Open(TheDevice().config.FindUser(user)->codepage)) {}

  void TakeLine(const std::string& line) {
    const std::size_t equals = std::min(line.find(" = "), line.size());
    const std::string key = line.substr(0, equals);
    const std::string value = line.substr(std::min(equals + 3, line.size()));
    if (key == "Path") {
      EndEntry();
      name_ = value;
    } else if (key == "Size") {
      entry_.st_size = std::strtoll(value.c_str(), nullptr, 10);
    } else if (key == "Modified") {
      std::tm time{};
      entry_.st_mtime = strptime(value.c_str(), "%Y-%m-%d %T", &time) == nullptr
                            ? 0
                            : timegm(&time) - OffsetOfToday();
    } else if ((key == "Folder" && value == "+") || (key == "Attributes" && value[0] == 'D')) {
      entry_.st_mode = S_IFDIR;
    } else if (key == "Encrypted" && value == "+") {
      is_encrypted_ = true;
    }
  }

  std::int64_t End() {
    EndEntry();
    return count_;
  }

  std::string Text(const std::string& format, bool is_whole) const {
    return "{\"format\":\"" + format + "\",\"entries\":[" + entries_ +
           "],\"count\":" + std::to_string(count_) + ",\"size\":" + std::to_string(size_) +
           ",\"complete\":" + ToText(is_whole && count_ <= kMostEntries) +
           ",\"encrypted\":" + ToText(is_encrypted_) + "}";
  }

 private:
  void EndEntry() {
    if (name_) {
      size_ += entry_.st_size;
      if (++count_ <= kMostEntries) {
        const bool is_foreign = code_page_ && !IsUtf8(*name_);
        AddEntry(entries_, is_foreign ? code_page_->Decode(*name_).value_or(*name_) : *name_,
                 entry_);
      }
    }
    name_.reset();
    entry_ = {};
    entry_.st_mode = S_IFREG;
  }

  const std::unique_ptr<CodePage> code_page_;
  std::optional<std::string> name_;
  struct stat entry_ {};
  std::string entries_;
  std::int64_t count_ = 0;
  std::int64_t size_ = 0;
  bool is_encrypted_ = false;
};

// False when patience ended before the last line.
bool ReadLines(const FileDescriptor& output, const Patience& patience, Contents& contents) {
  std::string text;
  std::array<char, 65536> block;
  while (!patience.IsOver(output.Get())) {
    const ssize_t got = read(output.Get(), block.data(), block.size());
    if (got <= 0) {
      return got == 0;
    }
    text.append(block.data(), static_cast<std::size_t>(got));
    std::size_t begin = 0;
    for (std::size_t end = 0; (end = text.find('\n', begin)) != std::string::npos;
         begin = end + 1) {
      contents.TakeLine(text.substr(begin, end - begin));
    }
    text.erase(0, begin);
  }
  return false;
}

[[noreturn]] void RefuseList(const FileDescriptor& errors) {
  std::array<char, 4096> block{};
  const ssize_t size = read(errors.Get(), block.data(), block.size());
  const std::string text(block.data(), size < 0 ? 0 : static_cast<std::size_t>(size));
  if (text.find("required memory") != std::string::npos) {
    ThrowMemoryShortage();
  }
  const bool is_encrypted = text.find("encrypted archive") != std::string::npos;
  throw Refused(kHttpNoArchive, is_encrypted ? "the archive's list is protected by a password"
                                             : "the archive is damaged");
}

}  // namespace

std::string ListArchive(const std::string& user, const std::string& path,
                        const Patience& patience) {
  struct stat status {};
  const FileDescriptor file = OpenFileOf(user, ResolveForUser(user, path), status);
  const std::string format = FormatOf(file);
  if (format.empty()) {
    throw Refused(kHttpNoArchive, "this is not a zip or 7z archive");
  }
  Fence fence;
  fence.AllowReading(file.Get());
  Pipe output;
  Pipe errors;
  ProgramStart start;
  start.program = KAVO_STOCK_7Z;
  // With a password that is none: it would ask for one.
  start.arguments = {KAVO_STOCK_7Z, "l",  "-slt",        "-ba",
                     "-bsp0",       "-p", "-t" + format, PathOf(file.Get())};
  start.environment = {"LC_ALL=C.UTF-8"};
  start.output = output.writer.Get();
  start.errors = errors.writer.Get();
  start.kept = {file.Get()};
  start.ends_with_caller = true;
  start.fence = &fence;
  setsid();  // away from the launcher's terminal, which the user's program is not to have
  ChildProcess program = ChildProcess::Start(start);
  output.writer.Close();
  errors.writer.Close();
  Contents contents(user);
  const bool is_read = ReadLines(output.reader, patience, contents);
  const bool is_whole = is_read && program.Wait() == 0;
  if (contents.End() == 0 && is_read && !is_whole) {
    RefuseList(errors.reader);
  }
  return contents.Text(format, is_whole);
}

}  // namespace Device
