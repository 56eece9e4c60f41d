// SPDX-License-Identifier: Apache-2.0
// Writes the form of Markdown that both the pages under docs and the manual pages are made from.
#include "tools/reference/markdown.h"

#include <cctype>

namespace veltrad::reference {
namespace {

enum class Kind { none, paragraph, code };

void open(std::string& page, Kind kind) {
  if (!page.empty()) page += '\n';
  if (kind == Kind::code) page += "```\n";
}

void close(std::string& page, Kind kind) {
  if (kind == Kind::code) page += "```\n";
}

bool isLetterOrDigit(char c) {
  return std::isalnum(static_cast<unsigned char>(c)) != 0;
}

}  // namespace

std::string escaped(std::string_view text) {
  std::string result;
  bool code = false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (c == '`') code = !code;
    const bool special = std::string_view("\\*<[]$|").find(c) != std::string_view::npos;
    const bool inWord =
        i > 0 && i + 1 < text.size() && isLetterOrDigit(text[i - 1]) && isLetterOrDigit(text[i + 1]);
    if (!code && (special || (c == '_' && !inWord))) result += '\\';
    result += c;
  }
  return result;
}

std::string prose(std::string_view text) {
  std::string page;
  Kind kind = Kind::none;
  while (!text.empty()) {
    const std::size_t end = text.find('\n');
    const std::string_view line = text.substr(0, end);
    text = end == std::string_view::npos ? std::string_view() : text.substr(end + 1);
    const Kind now = line.empty() ? Kind::none : line.starts_with("  ") ? Kind::code : Kind::paragraph;
    if (now != kind) {
      close(page, kind);
      if (now != Kind::none) open(page, now);
      kind = now;
    }
    if (kind == Kind::code) page += std::string(line.substr(2)) + '\n';
    if (kind == Kind::paragraph) page += escaped(line) + '\n';
  }
  close(page, kind);
  return page;
}

std::string sentence(std::string text) {
  if (!text.empty() && std::string_view(".:!?").find(text.back()) == std::string_view::npos) text += '.';
  return text;
}

}  // namespace veltrad::reference
