#include "tests/table.h"

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <iostream>

namespace {

std::string Unescape(std::string text) {
  for (std::size_t at = 0; (at = text.find('\\', at)) != std::string::npos; ++at) {
    const char kind = text[at + 1];
    if (kind == 'n' || kind == 's') {
      text.replace(at, 2, kind == 'n' ? "\n" : " ");
    }
  }
  return text;
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
  std::ifstream file(std::string(KAVO_TESTS_DIR) + "/tables/" + name);
  std::vector<TableRow> rows;
  bool is_in_row = false;
  for (std::string line; std::getline(file, line); is_in_row = !line.empty()) {
    const std::size_t colon = line.find(':');
    if (!is_in_row && !line.empty()) {
      rows.push_back({line, {}});
    } else if (!line.empty()) {
      rows.back().fields[line.substr(0, colon)].push_back(
          Unescape(line.substr(std::min(colon + 2, line.size()))));
    }
  }
  if (rows.empty()) {
    std::cerr << "no table " << name << '\n';
    std::abort();
  }
  return rows;
}
