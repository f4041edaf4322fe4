// What the archiver packs, and what it says when it cannot.
#include <fcntl.h>
#include <sys/stat.h>
#include <zip.h>

#include <chrono>
#include <cstdlib>
#include <ctime>

#include "tests/archiver_fixture.h"
#include "tests/unpacked.h"

namespace {

TEST_F(ArchiverTest, KeepsEveryNameWhateverItHolds) {
  Strings names = {"*",         "a?[b]",  "\"q\"",     "\"",   "-p",     "@at",
                   " lead",     "trail ", "tab\t",     "cr\r", "new\\n", "bad\xFF.txt",
                   "esc\x1B[m", "é日",    "e\xCC\x81", "...",  "!x",     "\xED\xA0\x80"};
  names.emplace_back("Error: No space left on device");
  Tree expected = {"d/", "d/a\nError: b=x", "d/pipe=", "d/sub/", "d/sub/e/", "pipe="};
  for (const std::string& name : names) {
    WriteFile(share / name, name);
    WriteFile(share / "d/sub" / name, name);
    expected.insert({name + "=" + name, "d/sub/" + name + "=" + name});
  }
  WriteFile(share / "d/a\nError: b", "x");
  WriteFile(share / "xother", "matched by a pattern only");
  fs::create_directories(share / "d/sub/e");
  ASSERT_EQ(mkfifo((share / "pipe").c_str(), 0600), 0);
  ASSERT_EQ(mkfifo((share / "d/pipe").c_str(), 0600), 0);
  Strings sources = names;
  sources.insert(sources.end(), {"d/sub", "d", "*", "pipe"});
  for (const char* page : {static_cast<const char*>(nullptr), ""}) {
    const std::string archive = page == nullptr ? "a*b" : "zip!";
    Good(archive, sources, {"a", "", "", page});
    EXPECT_EQ(Unpacked(out / archive), expected);
    EXPECT_EQ(ReadFile(out / archive).substr(0, 2), page == nullptr ? "7z" : "PK");
  }
}

TEST_F(ArchiverTest, StoresTimesInTheZoneThatHolds) {
  constexpr std::time_t kTime = 1'700'000'000;
  const timespec times[] = {{kTime, 0}, {kTime, 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, (share / "a").c_str(), times, 0), 0);
  for (const char* zone : {static_cast<const char*>(nullptr), "UTC-9"}) {
    zone == nullptr ? unsetenv("TZ") : setenv("TZ", zone, 1);
    Good("a.zip", {"a"}, {"a", "", "", ""});
    char local[sizeof "2000-01-01 00:00:00"];
    std::strftime(local, sizeof local, "%F %T", std::localtime(&kTime));
    const Ran listing = RunProgram({"/usr/bin/7z", "l", "-ba", out / "a.zip"});
    EXPECT_EQ(listing.out.rfind(local, 0), 0U) << listing.out;
  }
  unsetenv("TZ");
}

TEST_F(ArchiverTest, UpdatesAsTheActionsSay) {
  const std::string name(255, 'n');
  const struct {
    const char *command, *actions;
    Tree expected;
  } rows[] = {
      {"a", "", {"d/", "d/gone=1", "d/new=2", "d/same=2"}},
      {"u", "-up1q1r0x1y2z1w2", {"d/", "d/gone=1", "d/same=2"}},
      {"u", "-up1q0r2x1y2z1w2", {"d/", "d/new=2", "d/same=2"}},
  };
  for (const char* page : {static_cast<const char*>(nullptr), "CP932"}) {
    for (const auto& row : rows) {
      fs::remove_all(share / "d");
      fs::remove(out / name);
      WriteFile(share / "d/gone", "1");
      WriteFile(share / "d/same", "1");
      fs::last_write_time(share / "d/same",
                          fs::file_time_type::clock::now() - std::chrono::hours(1));
      Good(name, {"d"}, {"a", "", "", page});
      fs::remove(share / "d/gone");
      WriteFile(share / "d/same", "2");
      WriteFile(share / "d/new", "2");
      Good(name, {"d"}, {row.command, row.actions, "", page});
      EXPECT_EQ(Unpacked(out / name), row.expected) << row.command << row.actions;
      EXPECT_EQ(InOut(), Strings{name});
    }
  }
}

TEST_F(ArchiverTest, StoresZipNamesInTheCodePageAndFindsThemAgain) {
  WriteFile(share / "d/가", "cannot go to the code page");
  WriteFile(share / "d/plain", "1");
  WriteFile(share / "d/îΩ", "what 語 becomes in the code page");
  WriteFile(share / "d/語", "so this stays");
  for (const char* content : {"first", "second"}) {
    WriteFile(share / "d/日本ソ", content);
    Good("a.zip", {"d"}, {"a", "", "pass word", "CP932"});
    zip_t* const zip = zip_open((out / "a.zip").c_str(), ZIP_RDONLY, nullptr);
    ASSERT_NE(zip, nullptr);
    std::set<std::string> names;  // as bytes, and whether they are marked as UTF-8
    for (zip_int64_t entry = zip_get_num_entries(zip, 0); --entry >= 0;) {
      const auto index = static_cast<zip_uint64_t>(entry);
      const std::string raw = zip_get_name(zip, index, ZIP_FL_ENC_RAW);
      names.insert(raw + (raw == zip_get_name(zip, index, ZIP_FL_ENC_STRICT) ? " utf8" : " raw"));
    }
    zip_discard(zip);
    EXPECT_EQ(names, (std::set<std::string>{"d/ utf8", "d/plain utf8", "d/가 utf8", "d/îΩ utf8",
                                            "d/語 utf8", "d/\x93\xFA\x96\x7B\x83\x5C raw"}));
    const Strings unpack = {"/usr/bin/7z", "x", "-so", "-ppass word", out / "a.zip"};
    EXPECT_NE(RunProgram(unpack).out.find(content), std::string::npos);
  }
  EXPECT_EQ(InOut(), Strings{"a.zip"});
}

TEST_F(ArchiverTest, EncryptsWithThePasswordWhateverItHolds) {
  for (const std::string password : {" lead", "pä日\"'\\", "-p", "rogress", "tab\tend\r"}) {
    for (const bool old_header : {false, true}) {  // which asks for the password once more
      fs::remove(out / "z");
      if (old_header) {
        const Strings old = {"/usr/bin/7z", "a", "-mhe", "-sae", "-p" + password, out / "z", "a"};
        ASSERT_EQ(RunProgram(old, share).status, 0);
      }
      Good("z", {"a"}, {"a", "", password, nullptr});
      EXPECT_EQ(RunProgram({"/usr/bin/7z", "t", "-p" + password, out / "z"}).status, 0) << password;
      EXPECT_NE(RunProgram({"/usr/bin/7z", "t", "-pother", out / "z"}).status, 0) << password;
    }
  }
}

TEST_F(ArchiverTest, UpdatesAProtectedArchiveWithItsOwnPasswordAlone) {
  WriteFile(share / "b", "b");
  for (const char* page : {static_cast<const char*>(nullptr), "", "CP932"}) {
    fs::remove(out / "z");
    Good("z", {"a"}, {"a", "", "first", page});
    const std::string old = ReadFile(out / "z");
    for (const char* actions : {"", "-up1q1r0x1y2z1w2", "-up1q0r2x1y2z1w2"}) {
      const std::string command = *actions == 0 ? "a" : "u";
      for (const char* password : {"", "other"}) {
        Bad("z", {"a", "b"}, "password", {command, actions, password, page});
      }
    }
    EXPECT_EQ(ReadFile(out / "z"), old);
    Good("z", {"b"}, {"u", "", "first", page});
    EXPECT_EQ(RunProgram({"/usr/bin/7z", "t", "-pfirst", out / "z"}).status, 0);
    EXPECT_EQ(InOut(), Strings{"z"});
  }
}

TEST_F(ArchiverTest, UpdatesAZipThatIsProtectedByAes) {
  WriteFile(share / "zeros", std::string(300, '0'));
  ASSERT_EQ(RunProgram(
                {"/usr/bin/7z", "a", "-tzip", "-mem=AES256", "-sae", "-pfirst", out / "z", "zeros"},
                share)
                .status,
            0);
  Bad("z", {"a"}, "password", {"a", "", "other", ""});
  Good("z", {"a"}, {"a", "", "first", ""});
  EXPECT_EQ(RunProgram({"/usr/bin/7z", "t", "-pfirst", out / "z"}).status, 0);
}

TEST_F(ArchiverTest, NamesWhatIsMissingAndLeavesTheOldArchive) {
  Good("old", {"a"});
  const std::string old = ReadFile(out / "old");
  for (const char* target : {"new", "old"}) {
    Bad(target, {"a", "mis*sing"}, "mis*sing");
    Bad(target, {"a", "a/below"}, "a/below");
  }
  EXPECT_EQ(InOut(), Strings{"old"});
  EXPECT_EQ(ReadFile(out / "old"), old);
}

TEST_F(ArchiverTest, RefusesTargetsThatAreNoArchiveOfTheType) {
  WriteFile(out / "junk", "no archive");
  WriteFile(out / "empty", "");
  Good("seven", {"a"});
  const std::string seven = ReadFile(out / "seven");
  fs::create_symlink("seven", out / "link");
  fs::create_directory(out / "folder");
  const Strings before = InOut();
  for (const std::string& name : before) {
    Bad(name, {"a"}, "", {"a", "", "", "CP932"});
  }
  Bad("link", {"a"}, "link");
  Bad(std::string(256, 'n'), {"a"}, "File name too long");
  Bad("no/new", {"a"}, "No such file");
  EXPECT_EQ(InOut(), before);
  EXPECT_EQ(ReadFile(out / "junk") + ReadFile(out / "empty"), "no archive");
  EXPECT_EQ(ReadFile(out / "seven"), seven);
}

TEST_F(ArchiverTest, SaysWhyARequestCannotBeMet) {
  const struct {
    const char *page, *password;
    Strings sources;
    const char* cause;
  } rows[] = {{nullptr, "", {}, "names no files"},
              {"CP9x32", "", {"a"}, "unknown code page 'CP9x32'"},
              {"", "pä", {"a"}, "ASCII"},
              {nullptr, "a\nb", {"a"}, "line break"},
              {nullptr, "", {"@eaDir/x"}, "excluded"},
              {nullptr, "", {"../share/a"}, "../share/a"}};
  for (const auto& row : rows) {
    Bad("new", row.sources, row.cause, {"a", "", row.password, row.page});
  }
  Bad("new", {"a"}, "command", {"x", "", "", nullptr});
  EXPECT_EQ(InOut(), Strings{});
  WriteFile(share / "@eaDir/x", "");
  Good("new", {"@eaDir/x", "a"});
}

}  // namespace
