#include "device/archiver/error_text.h"

#include <algorithm>
#include <vector>

#include "device/archiver/failure.h"

namespace Archiver {
namespace {

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
  for (size_t begin = 0; begin < text_.size();) {
    const size_t end = std::min(text_.find('\n', begin), text_.size());
    const std::string line = WithoutHeading(text_.substr(begin, end - begin));
    begin = end + 1;
    const std::string explained = line.empty() ? line : Explain(line);
    if (!explained.empty() && std::find(said.begin(), said.end(), explained) == said.end()) {
      said.push_back(explained);
    }
  }
  std::string result;
  for (const std::string& line : said) {
    result += (result.empty() ? "" : "; ") + line;
  }
  return result;
}

}  // namespace Archiver
