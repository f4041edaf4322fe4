#include "tests/table.h"

#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <regex>

namespace {

std::string Unescape(const std::string& text) {
  static const std::regex kLineFeed(R"(\\n)");
  static const std::regex kBlank(R"(\\s)");
  return std::regex_replace(std::regex_replace(text, kLineFeed, "\n"), kBlank, " ");
}

}  // namespace

std::string TableRow::Get(const std::string& key, const std::string& fallback) const {
  return Has(key) ? fields.at(key).front() : fallback;
}

Strings TableRow::All(const std::string& key, const Strings& fallback) const {
  return Has(key) ? fields.at(key) : fallback;
}

void PrintTo(const TableRow& row, std::ostream* out) { *out << row.name; }

std::vector<TableRow> ReadTable(const std::string& name) {
  std::vector<TableRow> rows;
  bool is_in_row = false;
  for (const std::string& line : Lines(ReadFile(std::string(KAVO_TESTS_DIR) + "/tables/" + name))) {
    const std::size_t colon = line.find(':');
    if (!is_in_row && !line.empty()) {
      rows.push_back({line, {}});
    } else if (!line.empty()) {
      rows.back().fields[line.substr(0, colon)].push_back(
          Unescape(line.substr(std::min(colon + 2, line.size()))));
    }
    is_in_row = !line.empty();
  }
  if (rows.empty()) {
    std::cerr << "no table " << name << '\n';
    std::abort();
  }
  return rows;
}
