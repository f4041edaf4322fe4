// What an archive holds.
#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <set>

#include "tests/programs.h"

// "folder/", "link -> target", "file=contents".
using Tree = std::set<std::string>;

// All that 7z unpacks; unzip must find a zip sound too.
inline Tree Unpacked(const std::string& archive) {
  const TempFolder to;
  const Ran ran = RunProgram({"/usr/bin/7z", "x", "-spd", "-snld20", "-bso0", "-bsp0", "-pnone",
                              "-o" + to.Path(), archive});
  EXPECT_EQ(ran.status, 0) << ran.err;
  if (ReadFile(archive).substr(0, 2) == "PK") {
    const Ran tested = RunProgram({"/usr/bin/unzip", "-tqq", "-P", "none", archive});
    EXPECT_EQ(tested.status, 0) << tested.out << tested.err;
  }
  Tree tree;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(to.Path())) {
    tree.insert(entry.path().lexically_relative(to.Path()).string() +
                (entry.is_symlink()     ? " -> " + read_symlink(entry.path()).string()
                 : entry.is_directory() ? "/"
                                        : "=" + ReadFile(entry.path())));
  }
  return tree;
}
