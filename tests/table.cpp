#include "tests/table.h"

#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <regex>
#include <set>

namespace {

std::string Unescape(std::string text) {
  static const std::regex kLineFeed(R"(\\n)");
  static const std::regex kBlank(R"(\\s)");
  static const std::regex kRepeated(R"(\{(.)\*(\d+)\})");
  for (std::smatch found; std::regex_search(text, found, kRepeated);) {
    text = found.prefix().str() + std::string(std::stoul(found[2]), *found[1].first) +
           found.suffix().str();
  }
  return std::regex_replace(std::regex_replace(text, kLineFeed, "\n"), kBlank, " ");
}

}  // namespace

void PrintTo(const TableRow& row, std::ostream* out) { *out << row.name; }

std::vector<TableRow> ReadTable(const std::string& name, const Strings& keys) {
  static const std::regex kBeforeField(R"( \| |^ +)");
  const std::string path = std::string(KAVO_TESTS_DIR) + "/tables/" + name;
  std::vector<TableRow> rows;
  TableRow defaults;
  TableRow* row = &defaults;
  std::set<std::string> own;  // keys that the row has itself
  int number = 0;
  for (const std::string& line : Lines(ReadFile(path))) {
    ++number;
    if (line.empty() || line[0] == '#') {
      continue;
    }
    std::sregex_token_iterator token(line.begin(), line.end(), kBeforeField, -1);
    if (line[0] != ' ') {
      own.clear();
      row = *token == "----" ? &(defaults = {})
                             : &rows.emplace_back(TableRow{*token, defaults.fields});
    }
    while (++token != std::sregex_token_iterator()) {
      const std::string field = *token;
      const std::string key = field.substr(0, field.find(':'));
      if (std::find(keys.begin(), keys.end(), key) == keys.end()) {
        std::cerr << path << ':' << number << ": unknown key '" << key << "'\n";
        std::abort();
      }
      if (own.insert(key).second) {
        row->fields[key].clear();
      }
      row->fields[key].push_back(Unescape(field.substr(std::min(key.size() + 2, field.size()))));
    }
  }
  if (rows.empty()) {
    std::cerr << path << ": no rows\n";
    std::abort();
  }
  return rows;
}
