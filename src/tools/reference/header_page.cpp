// SPDX-License-Identifier: Apache-2.0
// Turns the comments of a header into paragraphs and its declarations into blocks of code.
#include "tools/reference/header_page.h"

#include <algorithm>

#include "base/text.h"
#include "tools/reference/markdown.h"

namespace veltrad::reference {
namespace {

constexpr std::string_view kExported = "VELTRA_API ";
constexpr std::string_view kTitle = "---- ";

class HeaderPage {
 public:
  void take(std::string_view line) {
    if (!_inComment && line.starts_with("/*")) {
      endCode();
      _inComment = true;
      line.remove_prefix(2);
    } else if (_inComment) {
      line = trimmed(line, " ");
      if (line.starts_with("*") && !line.starts_with("*/")) line.remove_prefix(1);
    }
    if (_inComment) return takeComment(line);
    if (line.starts_with("#") || line.starts_with("extern \"C\"") || line == "}") return;
    // Further lines of a declaration keep their place below its first one.
    if (line.starts_with(kExported) || _shifted) {
      line.remove_prefix(
          std::min(kExported.size(), _shifted ? line.find_first_not_of(' ') : kExported.size()));
      _shifted = line.find(';') == std::string_view::npos;
    }
    _code += std::string(line) + '\n';
  }

  std::string end() {
    endCode();
    return std::move(_page);
  }

 private:
  void takeComment(std::string_view line) {
    const std::size_t close = line.find("*/");
    const std::string_view text = trimmed(line.substr(0, close), " ");
    if (text.starts_with(kTitle)) {
      const std::size_t end = text.rfind(" ----");
      _page += "\n### " + escaped(text.substr(kTitle.size(), end - kTitle.size())) + "\n";
    } else if (!text.starts_with("SPDX-") && (!text.empty() || close == std::string_view::npos)) {
      _comment += std::string(text) + '\n';
    }
    if (close == std::string_view::npos) return;
    _inComment = false;
    if (const std::string paragraphs = prose(_comment); !paragraphs.empty()) _page += '\n' + paragraphs;
    _comment.clear();
  }

  void endCode() {
    const std::size_t first = _code.find_first_not_of('\n');
    if (first != std::string::npos) {
      const std::size_t last = _code.find_last_not_of('\n');
      _page += "\n```c\n" + _code.substr(first, last - first + 1) + "\n```\n";
    }
    _code.clear();
  }

  std::string _page;
  std::string _comment;
  std::string _code;
  bool _inComment = false;
  // Inside a declaration whose first line has lost kExported.
  bool _shifted = false;
};

}  // namespace

std::string pageOfHeader(std::string_view header) {
  HeaderPage page;
  while (!header.empty()) {
    const std::size_t end = header.find('\n');
    page.take(header.substr(0, end));
    header = end == std::string_view::npos ? std::string_view() : header.substr(end + 1);
  }
  return page.end().substr(1);
}

}  // namespace veltrad::reference
