#include "device/archiver/error_text.h"

#include <algorithm>
#include <vector>

#include "device/archiver/failure.h"

namespace Archiver {
namespace {

constexpr size_t kEnough = 16384;

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
  text_.append(bytes, 0, kEnough - std::min(kEnough, text_.size()));
}

bool ErrorText::HasWarning() const {
  const size_t mark = text_.find("WARNING: ");
  const size_t cause_end = text_.find('\n', mark);
  return mark != std::string::npos && cause_end != std::string::npos &&
         text_.find('\n', cause_end + 1) != std::string::npos;
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
