#include <zip.h>

#include "tests/archiver_test_support.h"

namespace ArchiverTest {
namespace {

class Packing : public ArchiverFixture {
 protected:
  void Good(const Outcome& outcome) {
    EXPECT_EQ(outcome.status, 0) << outcome.text;
    EXPECT_EQ(outcome.text.find("Error:"), std::string::npos) << outcome.text;
    EXPECT_EQ(outcome.Last(), "Progress: 100");
    EXPECT_EQ(outcome.Count("Total: "), 1);
  }
  // A staging folder with links to shares, as the caller makes one for several shares.
  void Stage(const std::map<std::string, fs::path>& shares) {
    folder = root / "stage";
    fs::create_directory(folder);
    list = folder / "list";
    for (const auto& [name, target] : shares) {
      fs::create_directory_symlink(target, folder / name);
    }
  }
  // "d/bytes|flag" of each entry; the flag says that the name is marked as UTF-8.
  Strings RawNames(const fs::path& archive) {
    zip_t* zip = zip_open(archive.c_str(), ZIP_RDONLY, nullptr);
    Strings names;
    for (zip_int64_t i = 0; zip != nullptr && i < zip_get_num_entries(zip, 0); ++i) {
      const auto index = static_cast<zip_uint64_t>(i);
      const std::string raw = zip_get_name(zip, index, ZIP_FL_ENC_RAW);
      const bool utf8 = raw == zip_get_name(zip, index, ZIP_FL_ENC_STRICT);
      names.push_back(raw + (utf8 ? "|utf8" : "|raw"));
    }
    zip_discard(zip);
    std::sort(names.begin(), names.end());
    return names;
  }
};

TEST_F(Packing, KeepsEveryNameWhateverItHolds) {
  const Strings names = {"*",         "a?[b]",  "\"q\"",     "\"",   "-p",     "@at",
                         " lead",     "trail ", "tab\t",     "cr\r", "new\\n", "bad\xFF.txt",
                         "esc\x1B[m", "é日",    "e\xCC\x81", "...",  "!x",     "\xED\xA0\x80"};
  for (const char* page : {static_cast<const char*>(nullptr), ""}) {
    std::map<std::string, std::string> expected = {{"d", "/"}, {"d/sub", "/"}, {"d/sub/e", "/"}};
    for (const std::string& name : names) {
      WriteFile(share / name, name);
      WriteFile(share / "d/sub" / name, name);
      expected[name] = expected["d/sub/" + name] = name;
    }
    WriteFile(share / "xother", "matched by a pattern only");
    fs::create_directories(share / "d/sub/e");
    Strings sources = names;
    sources.insert(sources.end(), {"d/sub", "d", "*"});
    Options options;
    options.code_page = page;
    const fs::path archive = out / (page == nullptr ? "a*b" : "zip!");
    const Outcome outcome = Pack(archive, sources, options);
    Good(outcome);
    EXPECT_EQ(outcome.Count("Compressing "), static_cast<long>(2 * names.size()));
    EXPECT_EQ(Unpacked(archive), expected);
    EXPECT_EQ(ReadFile(archive).substr(0, 2), page == nullptr ? "7z" : "PK");
  }
}

TEST_F(Packing, LetsNoFileNameForgeALine) {
  WriteFile(share / "Error: No space left on device", "x");
  WriteFile(share / "d/a\nError: b", "x");
  const Outcome outcome = Pack(out / "a", {"Error: No space left on device", "d"});
  EXPECT_EQ(outcome.status, 0);
  EXPECT_EQ(outcome.Count("Error:"), 0);
  EXPECT_EQ(outcome.Count("Compressing Error: No space left on device"), 1);
  EXPECT_EQ(outcome.Last(), "Progress: 100");
}

TEST_F(Packing, WaitsForNoPipe) {
  WriteFile(share / "d/a", "a");
  ASSERT_EQ(mkfifo((share / "d/pipe").c_str(), 0600), 0);
  ASSERT_EQ(mkfifo((share / "listed").c_str(), 0600), 0);
  for (const char* page : {static_cast<const char*>(nullptr), "CP932"}) {
    Options options;
    options.code_page = page;
    Good(Pack(out / "a", {"d", "listed"}, options));
    EXPECT_EQ(Names(out / "a"), (Strings{"d", "d/a", "d/pipe", "listed"}));
    fs::remove(out / "a");
  }
}

TEST_F(Packing, PacksSeveralSharesUnderTheirNamesWithLinksKept) {
  for (const char* second : {"music", "elsewhere/tunes"}) {  // in one folder, and scattered
    WriteFile(share / "photo/trip/a.jpg", "a");
    WriteFile(share / "photo/trip/unlisted/b", "b");
    WriteFile(share / second / "song", "s");
    WriteFile(root / "outside/secret", "secret");
    fs::create_symlink("../..", share / second / "loop");
    fs::create_symlink("nowhere", share / "photo/trip/broken");
    ASSERT_EQ(mkfifo((share / second / "pipe").c_str(), 0600), 0);
    fs::create_symlink("../../../outside", share / "photo/trip/out\xFF");
    Stage({{"photo", share / "photo"}, {"music", share / second}});
    const Strings sources = {"photo/trip/a.jpg", "photo/trip/broken", "photo/trip/out\xFF",
                             "music"};
    Good(Pack(out / "a", sources));
    const std::map<std::string, std::string> expected = {
        {"photo", "/"},
        {"photo/trip", "/"},
        {"photo/trip/a.jpg", "a"},
        {"photo/trip/broken", "-> nowhere"},
        {"photo/trip/out\xFF", "-> ../../../outside"},
        {"music", "/"},
        {"music/song", "s"},
        {"music/pipe", ""},
        {"music/loop", "-> ../.."}};
    EXPECT_EQ(Unpacked(out / "a"), expected);
    TearDown();
    SetUp();
  }
}

TEST_F(Packing, UpdatesAsTheActionsSay) {
  const std::string file_name(255, 'n');
  const struct {
    const char *command, *actions;
    std::map<std::string, std::string> expected;
  } cases[] = {
      {"a", "", {{"d", "/"}, {"d/gone", "1"}, {"d/new", "2"}, {"d/same", "2"}}},
      {"u", "-up1q1r0x1y2z1w2", {{"d", "/"}, {"d/gone", "1"}, {"d/same", "2"}}},
      {"u", "-up1q0r2x1y2z1w2", {{"d", "/"}, {"d/new", "2"}, {"d/same", "2"}}},
  };
  for (const char* page : {static_cast<const char*>(nullptr), "CP932"}) {
    for (const auto& c : cases) {
      fs::remove_all(share / "d");
      fs::remove(out / file_name);
      WriteFile(share / "d/gone", "1");
      WriteFile(share / "d/same", "1");
      fs::last_write_time(share / "d/same",
                          fs::file_time_type::clock::now() - std::chrono::hours(1));
      Options options;
      options.code_page = page;
      Good(Pack(out / file_name, {"d"}, options));
      fs::remove(share / "d/gone");
      WriteFile(share / "d/same", "2");
      WriteFile(share / "d/new", "2");
      options.command = c.command;
      options.actions = c.actions;
      Good(Pack(out / file_name, {"d"}, options));
      EXPECT_EQ(Unpacked(out / file_name), c.expected) << c.command << c.actions;
      EXPECT_EQ(InOut(), Strings{file_name});
    }
  }
}

TEST_F(Packing, StoresZipNamesInTheCodePageAndFindsThemAgain) {
  WriteFile(share / "d/日本ソ", "");
  WriteFile(share / "d/가", "cannot go to the code page");
  WriteFile(share / "d/plain", "1");
  Options options;
  options.code_page = "CP932";
  options.password = "pass word";
  const Strings expected = {"d/plain|utf8", "d/\x93\xFA\x96\x7B\x83\x5C|raw", "d/|utf8",
                            "d/가|utf8"};
  for (const char* content : {"first", "second"}) {
    WriteFile(share / "d/日本ソ", content);
    Good(Pack(out / "a.zip", {"d"}, options));
    Strings names = RawNames(out / "a.zip");
    Strings sorted = expected;
    std::sort(sorted.begin(), sorted.end());
    EXPECT_EQ(names, sorted);
    const Strings unpack = {"/usr/bin/7z", "x", "-so", "-ppass word", out / "a.zip"};
    EXPECT_NE(Execute(unpack, root).text.find(content), std::string::npos);
  }
  EXPECT_EQ(InOut(), Strings{"a.zip"});
}

TEST_F(Packing, EncryptsWithThePasswordWhateverItHolds) {
  WriteFile(share / "a", "content");
  for (const std::string password : {" lead", "pä日\"'\\", "-p", "rogress", "tab\tend\r"}) {
    for (const bool old_header : {false, true}) {  // which asks for the password once more
      const fs::path archive = out / "a";
      fs::remove(archive);
      if (old_header) {
        Execute({"/usr/bin/7z", "a", "-t7z", "-sae", "-mhe", "-p" + password, archive, "a"}, share);
      }
      Options options;
      options.password = password;
      Good(Pack(archive, {"a"}, options));
      const auto test = [&](const std::string& tried) {
        return Execute({"/usr/bin/7z", "t", "-p" + tried, archive}, root).status;
      };
      EXPECT_EQ(test(password), 0) << password;
      EXPECT_NE(test("other"), 0) << password;
    }
  }
}

TEST_F(Packing, MakesAnArchiveOfTheUmasksMode) {
  WriteFile(share / "a", "a");
  for (const mode_t mask : {022U, 077U}) {
    const Strings argv = CommandLine(out / "a", {"a"});
    Good(Execute(argv, folder, [mask] { umask(mask); }));
    EXPECT_EQ(fs::status(out / "a").permissions(), static_cast<fs::perms>(0666 & ~mask));
    fs::remove(out / "a");
  }
}

}  // namespace
}  // namespace ArchiverTest
