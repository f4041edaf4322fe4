// Tables of cases in tests/tables. A line that does not begin with a blank begins a row with its
// name. Fields, "key: value", follow after " | " or in indented lines; a key that stands several
// times has several values. A row named "----" is none: its fields are the defaults of the rows up
// to the next
// "----", each for the rows that lack its key. A line with "#" in front is a comment. In values \n
// is a line feed, \s a blank, {n*256} 256 times n.
#pragma once

#include <gtest/gtest.h>

#include <iosfwd>
#include <map>
#include <string>
#include <vector>

#include "tests/programs.h"

struct TableRow {
  bool Has(const std::string& key) const { return fields.count(key) != 0; }
  Strings All(const std::string& key, const Strings& fallback = {}) const {
    return Has(key) ? fields.at(key) : fallback;
  }
  // The first value of the key, or the fallback.
  std::string Get(const std::string& key, const std::string& fallback = "") const {
    return All(key, {fallback}).front();
  }

  std::string name;
  std::map<std::string, Strings> fields;
};
void PrintTo(const TableRow& row, std::ostream* out);

// Ends the program, naming the line, when a key is none of these.
std::vector<TableRow> ReadTable(const std::string& name, const Strings& keys);

// One test for each row of the table of that name, for a fixture with TableRow as its parameter.
// The keys that rows may have follow.
#define INSTANTIATE_TABLE(fixture, table, ...)                                                  \
  INSTANTIATE_TEST_SUITE_P(Table, fixture, testing::ValuesIn(ReadTable(#table, {__VA_ARGS__})), \
                           [](const auto& row) { return row.param.name; })
