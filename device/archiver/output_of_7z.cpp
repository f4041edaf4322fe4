#include "device/archiver/output_of_7z.h"

#include <algorithm>
#include <charconv>
#include <cstring>

#include "device/archiver/failure.h"
#include "device/base/for_each_part.h"

namespace Archiver {
namespace {

constexpr char kWipe = '\b';
constexpr char kTotal[] = "Add new data to archive: ";
constexpr char kDamaged[] = "Headers Error";  // among the warnings about the old archive

// The number that ends right before `end`; false when there is none.
bool NumberBefore(std::string_view text, size_t end, uint64_t* number) {
  text = text.substr(0, end);
  text.remove_prefix(text.find_last_not_of("0123456789") + 1);
  return std::from_chars(text.data(), text.data() + text.size(), *number).ec == std::errc();
}

// A progress text is "  0M Scan " or " 84% 12 + name": it starts with blanks or digits, as no line
// does.
bool StartsProgress(std::string_view text) {
  return !text.empty() && (text[0] == ' ' || (text[0] >= '0' && text[0] <= '9')) &&
         text.find_first_of("%M") != std::string::npos;
}

// The name in " 84% 12 + name", where "+" stands for a new file and "U" for a changed one.
std::string_view NameIn(std::string_view text) {
  const size_t mark = text.find_first_not_of(" 0123456789%");
  const bool is_name = mark != std::string_view::npos && text.find('%') < mark &&
                       (text.substr(mark, 2) == "+ " || text.substr(mark, 2) == "U ");
  return is_name ? text.substr(mark + 2) : std::string_view();
}

// The length of the text that `line` starts with and that is wiped right behind: as many
// backspaces, blanks and backspaces. 0 while that is not complete. A name may hold backspaces of
// its own.
size_t WipedLength(std::string_view line) {
  for (size_t at = line.find(kWipe); 4 * at <= line.size(); at = line.find(kWipe, at + 1)) {
    const std::string back(at, kWipe);
    if (line.substr(at, 3 * at) == back + std::string(at, ' ') + back) {
      return at;
    }
  }
  return 0;
}

constexpr size_t kEnough = 16384;
constexpr char kWarning[] = "WARNING: ";

// The end of the two lines of the warning that begins at `mark`, cause and object.
size_t EndOfWarning(const std::string& text, size_t mark) {
  const size_t cause_end = text.find('\n', mark);
  return cause_end == std::string::npos ? cause_end : text.find('\n', cause_end + 1);
}

std::string WithoutHeading(const std::string& line) {
  for (const std::string heading : {"ERROR:", "Error:", "System ERROR:", "ERRORS:", "WARNING:",
                                    "WARNINGS:", "Open ERROR:", "Command Line Error:"}) {
    if (line.compare(0, heading.size(), heading) == 0) {
      const size_t rest = line.find_first_not_of(' ', heading.size());
      return rest == std::string::npos ? std::string() : line.substr(rest);
    }
  }
  return line;
}

std::string Explain(const std::string& line) {
  if (line.compare(0, 6, "errno=") == 0) {
    const size_t colon = line.find(" : ");
    return colon == std::string::npos ? line : line.substr(colon + 3);
  }
  if (line == "Break signaled") {
    return "interrupted by a signal, or by the old archive's question for its password";
  }
  return NameInError(line);
}

}  // namespace

std::vector<Event> OutputParser::Feed(const std::string& bytes) {
  std::vector<Event> events;
  pending_ += bytes;
  std::string_view rest = pending_;
  for (bool more = true; more;) {
    const size_t line_end = std::min(rest.find('\n'), rest.size());
    const std::string_view line = rest.substr(0, line_end);
    const size_t wiped = TakeProgress(line, &events);
    more = wiped > 0 || line_end < rest.size();
    if (wiped > 0) {
      rest.remove_prefix(wiped);
    } else if (more) {
      TakeLine(std::string(line), &events);
      rest.remove_prefix(line_end + 1);
    }
    percent_seen_ = percent_seen_ && !more;
  }
  pending_ = std::string(rest);
  return events;
}

// Reports the percentage that `line` starts with at once, for 7z wipes a progress text only when it
// has a new one; the name, which may still be cut, is reported then. Returns the length of the text
// and its wiping, 0 while that is not complete.
size_t OutputParser::TakeProgress(std::string_view line, std::vector<Event>* events) {
  const std::string_view text = line.substr(0, line.find(kWipe));
  if (!StartsProgress(text)) {
    return 0;
  }
  uint64_t percent = 0;
  const size_t sign = text.find('%');
  if (!percent_seen_ && sign != std::string::npos && NumberBefore(text, sign, &percent)) {
    percent_seen_ = true;
    events->push_back({Event::Kind::kPercent, percent, {}});
  }
  const size_t length = WipedLength(line);
  if (const std::string_view name = NameIn(line.substr(0, length)); !name.empty()) {
    events->push_back({Event::Kind::kFile, 0, std::string(name)});
  }
  return 4 * length;
}

void OutputParser::TakeLine(const std::string& line, std::vector<Event>* events) {
  // It would go on: members that it has not found are kept beside new ones of their names.
  if (line == kDamaged) {
    throw Failure("cannot update the archive: its headers contradict each other");
  }
  uint64_t bytes = 0;
  if (line.compare(0, std::strlen(kTotal), kTotal) == 0 &&
      NumberBefore(line, line.find(" byte"), &bytes)) {
    events->push_back({Event::Kind::kTotal, bytes, {}});
  }
}

void ErrorText::Feed(const std::string& bytes) {
  text_ += bytes;
  for (size_t mark = text_.find(kWarning); mark != std::string::npos;
       mark = text_.find(kWarning, mark)) {
    const size_t end = EndOfWarning(text_, mark);
    const size_t object = text_.find('\n', mark) + 1;
    if (end == std::string::npos || left_out_.count(text_.substr(object, end - object)) == 0) {
      break;
    }
    text_.erase(mark, end - mark);
    has_passed_over_ = true;
  }
  text_.resize(std::min(kEnough, text_.size()));
}

bool ErrorText::HasWarning() const {
  const size_t mark = text_.find(kWarning);
  return mark != std::string::npos && EndOfWarning(text_, mark) != std::string::npos;
}

std::string ErrorText::Line() const {
  std::vector<std::string> said;
  Device::ForEachPart(text_, "\n", [&](std::string_view part) {
    const std::string explained = Explain(WithoutHeading(std::string(part)));
    if (!explained.empty() && std::find(said.begin(), said.end(), explained) == said.end()) {
      said.push_back(explained);
    }
  });
  std::string result;
  for (const std::string& line : said) {
    result += (result.empty() ? "" : "; ") + line;
  }
  return result;
}

}  // namespace Archiver
