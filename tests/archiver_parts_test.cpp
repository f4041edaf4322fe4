// The archiver's own parts, with input that the whole program hardly gets.
#include <gtest/gtest.h>
#include <unistd.h>

#include "device/archiver/command_line.h"
#include "device/archiver/failure.h"
#include "device/archiver/list_file.h"
#include "device/archiver/output_of_7z.h"
#include "device/archiver/program.h"
#include "device/archiver/special_files.h"
#include "device/archiver/switches.h"
#include "device/base/code_page.h"
#include "tests/programs.h"

namespace Archiver {
namespace {

namespace fs = std::filesystem;

TEST(CommandLine, RefusesWhatNoCallerSends) {
  for (const char* arguments : {"", "x /a @l", "a rel @l", "a @l", "a /a", "a /a @l -mx",
                                "a /a/ @l", "a /a @l -up1!/etc", "a /a /b @l", "a /a @l -xr!"}) {
    EXPECT_THROW(ParseCommandLine(Words(arguments)), Failure) << arguments;
  }
}

TEST(ListFile, NamesEachSourceOnceWithoutItsDots) {
  EXPECT_EQ(WithoutNested(ReadSources("./b/\n./b/x\n./a b \n././b//.\n./bx\n./c/d/e\n./c/d\n", "l"),
                          {{"b", {}}, {"c/d", {}}}),
            (Strings{"b", "a b ", "bx", "c/d"}));
  for (const char* text : {"", "\n", "./\n", "/etc\n", "./a/../../b\n", "..\n"}) {
    EXPECT_THROW(ReadSources(text, "l"), Failure) << text;
  }
}

TEST(Memory, FewerThreadsGoBeforeASmallerDictionary) {
  const struct {
    const char* level;
    unsigned int mebibytes, processors;
    const char* switches;
  } rows[] = {
      {"-mx9", 4096, 2, ""},
      {"-mx9", 1024, 2, "-md=67108864b"},
      {"-mx6", 1024, 8, "-mmt=2"},
      {"-mx6", 784, 2, ""},
      {"-mx6", 783, 2, "-md=33554432b"},
      {"", 500, 1, ""},
      {"", 3000, 8, ""},
      {"", 2000, 8, "-mmt=6"},
      {"-mx3", 85, 2, "-mmt=1"},
      {"-mx3", 85, 1, ""},
      {"-mx0", 1, 8, ""},
      {"-mx6", 1, 2, "-md=65536b"},
      {"-mx6", 0, 4, "-mmt=2 -md=65536b"},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(SwitchesWithin(std::uint64_t{row.mebibytes} << 20U, row.level, row.processors),
              Words(row.switches))
        << row.level << " within " << row.mebibytes;
  }
}

TEST(OutputParser, ReadsTheSameEventsHoweverTheOutputIsCut) {
  const auto wiped = [](const std::string& text) {
    const std::string back(text.size(), '\b');
    return text + back + std::string(text.size(), ' ') + back;
  };
  const std::string output =
      wiped("  0M Scan ") +
      "1 file, 9 bytes\n\nAdd new data to archive: 2 files, 5000000000 bytes\n" + wiped("  0%") +
      wiped(" 7% + a/50%") + wiped(" 84% 1 U 1 + b") + wiped(" 85% + c\b\b/d\b") + "= kept\n" +
      wiped(" 99% 2 D gone") + "\n  3% 12 + cut";
  for (size_t step = 1; step <= output.size(); ++step) {
    OutputParser parser;
    std::string found;
    for (size_t at = 0; at < output.size(); at += step) {
      for (const Event& event : parser.Feed(output.substr(at, step))) {
        found += event.kind == Event::Kind::kFile    ? "F" + event.name
                 : event.kind == Event::Kind::kTotal ? "T" + std::to_string(event.value)
                                                     : "P" + std::to_string(event.value);
        found += ' ';
      }
    }
    EXPECT_EQ(found, "T5000000000 P0 P7 Fa/50% P84 F1 + b P85 Fc\b\b/d\b P99 P3 ")
        << "in steps of " << step;
  }
  EXPECT_THROW(OutputParser().Feed("\nWARNINGS:\nHeaders Error\n"), Failure);
}

// A name that is a link when it is mirrored, and a folder when what is in it is.
TEST(SpecialFiles, AreNotMadeBehindALink) {
  const TempFolder temp;
  for (const char* folder : {"/share", "/work"}) {
    fs::create_directory(temp.Path() + folder);
  }
  const Device::FileDescriptor work(open((temp.Path() + "/work").c_str(), O_PATH));
  const WorkPlace place{Device::FileDescriptor(open((temp.Path() + "/share").c_str(), O_PATH)), {}};
  fs::create_symlink("/tmp", temp.Path() + "/share/a");
  MirrorSpecials(place, {"a"}, work.Get());
  fs::remove(temp.Path() + "/share/a");
  WriteFile(temp.Path() + "/share/a/x", "");
  EXPECT_THROW(MirrorSpecials(place, {"a/x"}, work.Get()), Failure);
}

TEST(CodePage, ConvertsOnlyWhatComesBackUnchanged) {
  const struct {
    const char *page, *utf8, *bytes;
  } rows[] = {{"CP932", "日本ソ", "\x93\xFA\x96\x7B\x83\x5C"},
              {"932", "あ", "\x82\xA0"},
              {"CP437", "é", "\x82"},
              {"GBK", "中", "\xD6\xD0"},
              {"ISO-8859-1", "é", "\xE9"},
              {"ISO-8859-1", "日", "none"},
              {"CP932", "bad\xFF", "none"},
              {"CP437", "가", "none"}};
  for (const auto& row : rows) {
    EXPECT_EQ(Device::CodePage::Open(row.page)->Encode(row.utf8).value_or("none"), row.bytes)
        << row.utf8;
  }
  for (const char* useless_in_paths :
       {"CP9x32", "UTF-16", "UTF-7", "CP037", "CP932//IGNORE", "CP932,ASCII", "-"}) {
    EXPECT_EQ(Device::CodePage::Open(useless_in_paths), nullptr) << useless_in_paths;
  }
}

// What 7z says on standard error, a heading, the cause and the object on lines of their own.
TEST(Run7z, TellsCauseAndObjectInOneLine) {
  const struct {
    const char *script, *line;
  } rows[] = {
      {"/nonexistent/7z", "cannot start '/nonexistent/7z': No such file or directory"},
      {"kill -9 $$", "7z was killed by signal 9, maybe for want of memory"},
      {"exit 2", "7z failed with status 2"},
      {"echo 'ERROR: oops' >&2", "7z failed with status 0: oops"},
      {R"(printf '\n\nSystem ERROR:\nerrno=28 : No space left\n' >&2; exit 2)",
       "7z failed with status 2: No space left"},
      {R"(printf '\nWARNING: errno=13 : Permission den' >&2; exit 1)",
       "7z failed with status 1: Permission den"},
      {R"(printf 'Error:\ncannot open file\n/v/x\nerrno=36 : Long\n\n\nSystem ERROR:\n' >&2
          printf 'errno=36 : Long\n' >&2; exit 2)",
       "7z failed with status 2: cannot open file; /v/x; Long"},
      {R"(printf 'WARNING: errno=2 : Gone\nleft out\n' >&2; exit 2)", "7z failed with status 2"},
      {R"(printf 'WARNING: errno=2 : Gone\nleft out\nWARNING: errno=2 : Lost\na\n' >&2; exit 1)",
       "not everything can be packed: Lost; a"},
      // At a warning 7z is not waited for.
      {R"(printf 'WARNING: errno=2 : No\nError: File name too long\033[m\n' >&2; exec sleep 60)",
       "not everything can be packed: No; File_name_too_long?[m"}};
  for (const auto& row : rows) {
    const Report report(STDOUT_FILENO);
    Device::ProgramStart start;
    start.program = *row.script == '/' ? row.script : "/bin/sh";
    start.arguments = {start.program, "-c", row.script};
    try {
      Run7z(start, {"left out"}, report, [](const std::string& /*output*/) {});
      ADD_FAILURE() << "succeeded: " << row.script;
    } catch (const std::exception& error) {
      EXPECT_STREQ(error.what(), row.line);
    }
  }
}

}  // namespace
}  // namespace Archiver
