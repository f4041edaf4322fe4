#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "device/archiver/code_page.h"
#include "device/archiver/command_line.h"
#include "device/archiver/error_text.h"
#include "device/archiver/failure.h"
#include "device/archiver/list_file.h"
#include "device/archiver/progress.h"

namespace Archiver {
namespace {

using Strings = std::vector<std::string>;

TEST(CommandLine, ReadsTheCallersVectorWithItsEmptyArguments) {
  const Request zip = ParseCommandLine({"u", "-utf16", "/v/a.zip", "-up1q0r2x1y2z1w2", "-mx9",
                                        "-langCP932", "-p -x", "-xr!@eaDir", "@/t/l", "-progress"});
  EXPECT_TRUE(zip.zip);
  EXPECT_EQ(zip.code_page, "CP932");
  EXPECT_EQ(zip.actions, "p1q0r2x1y2z1w2");
  EXPECT_EQ(zip.password, " -x");
  EXPECT_EQ(zip.exclude, Strings{"@eaDir"});
  const Request plain =
      ParseCommandLine({"", "-utf16", "/v/a", "", "", "-xr!@eaDir", "@/t/l", "-progress"});
  EXPECT_FALSE(plain.zip);
  EXPECT_EQ(plain.actions, "p1q1r2x2y2z2w2");
  EXPECT_EQ(plain.list_path, "/t/l");
}

TEST(CommandLine, TellsThePasswordRogressFromTheSwitch) {
  EXPECT_EQ(ParseCommandLine({"a", "/a", "-progress", "@l", "-progress"}).password, "rogress");
  EXPECT_EQ(ParseCommandLine({"a", "/a", "@l", "-progress"}).password, "");
}

TEST(CommandLine, RefusesWhatNoCallerSends) {
  const std::vector<Strings> wrong = {{},
                                      {"x", "/a", "@l"},
                                      {"a", "rel", "@l"},
                                      {"a", "@l"},
                                      {"a", "/a"},
                                      {"a", "/a", "@l", "-mx"},
                                      {"a", "/a/", "@l"},
                                      {"a", "/a", "@l", "-up1!/etc"},
                                      {"a", "/a", "/b", "@l"},
                                      {"a", "/a", "@l", "-xr!"}};
  for (const Strings& arguments : wrong) {
    EXPECT_THROW(ParseCommandLine(arguments), Failure) << testing::PrintToString(arguments);
  }
}

TEST(ListFile, NamesEachSourceOnceWithoutItsDots) {
  EXPECT_EQ(
      WithoutNested(ReadSources("./b/\n./b/x\n./a b \n././b//.\n./bx\n./c/d/e\n./c/d\n", "l")),
      (Strings{"b", "a b ", "bx", "c/d"}));
}

TEST(ListFile, RefusesLinesThatLeaveTheFolderAndEmptyLists) {
  for (const std::string text : {"", "\n", "./\n", "/etc\n", "./a/../../b\n", "..\n"}) {
    EXPECT_THROW(ReadSources(text, "l"), Failure) << text;
  }
}

TEST(ListFile, HandsNamesThatNoLineHoldsToTheCommandLine) {
  const NamesFor7z names =
      DivideNames({"a", "\"q\"", "cr\r", "bad\xFF", "\xED\xA0\x80", "\xC3\xA9"});
  EXPECT_EQ(names.list, "\"a\"\n\"\"q\"\"\n\"\xC3\xA9\"\n");
  EXPECT_EQ(names.arguments, (Strings{"cr\r", "bad\xFF", "\xED\xA0\x80"}));
}

TEST(OutputParser, ReadsTheSameEventsHoweverTheOutputIsCut) {
  const auto wiped = [](const std::string& text) {
    const std::string back(text.size(), '\b');
    return text + back + std::string(text.size(), ' ') + back;
  };
  const std::string output =
      wiped("  0M Scan ") +
      "1 file, 9 bytes\n\nAdd new data to archive: 2 files, 5000000000 bytes\n" + wiped("  0%") +
      "+ a/50%\n" + wiped(" 7%") + wiped(" 84% 1") + "U b\b\n= kept\n" + wiped(" 99% 2") +
      "\n  3% name\n+ c";
  const std::string expected = "T5000000000 P0 Fa/50% P7 P84 Fb\b P99 P3 ";
  for (size_t step = 1; step <= output.size(); ++step) {
    OutputParser parser;
    std::string found;
    for (size_t at = 0; at < output.size(); at += step) {
      for (const Event& event : parser.Feed(output.substr(at, step))) {
        found += event.kind == Event::Kind::kFile
                     ? "F" + event.name + " "
                     : (event.kind == Event::Kind::kTotal ? "T" : "P") +
                           std::to_string(event.value) + " ";
      }
    }
    EXPECT_EQ(found, expected) << "in steps of " << step;
  }
}

TEST(ErrorText, PutsCauseAndObjectOnOneLine) {
  const struct {
    std::string said, line;
    bool warning;
  } cases[] = {
      {"\n\nSystem ERROR:\nerrno=28 : No space left on device\n", "No space left on device", false},
      {"\nWARNING: errno=13 : Permission denied\nd/b\n\n", "Permission denied; d/b", true},
      {"\nWARNING: errno=13 : Permission den", "Permission den", false},
      {"\nError:\ncannot open file\n/v/x\nerrno=36 : File name too long\n\n\nSystem ERROR:\n"
       "errno=36 : File name too long\n",
       "cannot open file; /v/x; File name too long", false},
      {"\nWARNING: errno=13 : Permission denied\nError: No space left on device\x1B[m\n",
       "Permission denied; No_space_left_on_device?[m", true},
  };
  for (const auto& c : cases) {
    ErrorText text;
    for (const char byte : c.said) {
      text.Feed(std::string(1, byte));
    }
    EXPECT_EQ(text.Line(), c.line);
    EXPECT_EQ(text.HasWarning(), c.warning) << c.said;
  }
}

TEST(CodePage, ConvertsOnlyWhatComesBackUnchanged) {
  const struct {
    const char *page, *utf8, *bytes;
  } cases[] = {{"CP932", "日本ソ", "\x93\xFA\x96\x7B\x83\x5C"},
               {"932", "あ", "\x82\xA0"},
               {"Shift_JIS", "あ", "\x82\xA0"},
               {"CP437", "é", "\x82"},
               {"GBK", "中", "\xD6\xD0"},
               {"EUC-KR", "가", "\xB0\xA1"},
               {"ISO-8859-1", "é", "\xE9"},
               {"ISO-8859-1", "日", nullptr},
               {"CP932", "bad\xFF", nullptr},
               {"CP437", "가", nullptr}};
  for (const auto& c : cases) {
    const auto encoded = CodePage(c.page).Encode(c.utf8);
    EXPECT_EQ(encoded.value_or("none"), c.bytes == nullptr ? "none" : c.bytes) << c.page << c.utf8;
  }
}

TEST(CodePage, RefusesWhatCannotServeInPaths) {
  for (const char* name :
       {"CP9x32", "UTF-16", "UTF-7", "CP037", "CP932//IGNORE", "CP932,ASCII", "-"}) {
    EXPECT_THROW(CodePage{name}, Failure) << name;
  }
}

}  // namespace
}  // namespace Archiver
