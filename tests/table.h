// Tables of cases in tests/tables: a row is a line with its name and lines of "key: value"; a key
// may stand several times; an empty line ends the row. In values \n is a line feed and \s a blank.
#pragma once

#include <gtest/gtest.h>

#include <iosfwd>
#include <map>
#include <string>
#include <vector>

#include "tests/programs.h"

struct TableRow {
  // The first value of the key, or the fallback.
  std::string Get(const std::string& key, const std::string& fallback = "") const;
  Strings All(const std::string& key, const Strings& fallback = {}) const;
  bool Has(const std::string& key) const { return fields.count(key) != 0; }

  std::string name;
  std::map<std::string, Strings> fields;
};
void PrintTo(const TableRow& row, std::ostream* out);

std::vector<TableRow> ReadTable(const std::string& name);

// One test for each row of the table of that name, for a fixture with TableRow as its parameter.
#define INSTANTIATE_TABLE(fixture, table)                                        \
  INSTANTIATE_TEST_SUITE_P(Table, fixture, testing::ValuesIn(ReadTable(#table)), \
                           [](const auto& row) { return row.param.name; })
