// SPDX-License-Identifier: Apache-2.0
// Redacts line by line with patterns, after removing private keys, which span lines.
#include "tools/ctl/redaction.h"

#include <pwd.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <regex>
#include <set>
#include <utility>

namespace veltrad::ctl {

namespace {

constexpr const char* kLeftOut = "(left out)";
// The library's matcher takes stack for each character.
constexpr std::size_t kLongestShownLine = 4096;

constexpr const char* kSecretWord =
    "(?:pass(?:word|wd|phrase)?|secret|token|api[_-]?key|authori[sz]ation|cookie|credential|private[_-]?key)"
    "[a-z0-9_-]*";

struct Pattern {
  std::regex pattern;
  const char* instead;
};

std::regex pattern(const std::string& text) {
  return std::regex(text, std::regex::ECMAScript | std::regex::icase | std::regex::optimize);
}

// In this order: a URL is matched before its parts.
const std::vector<Pattern>& patterns() {
  static const std::vector<Pattern> kPatterns = {
      {pattern("([a-z][a-z0-9+.-]*://)[^/\\s\"'?#]*@"), "$1(left out)@"},
      {pattern("([a-z][a-z0-9+.-]*://[^\\s\"'?#<>]*)[?#][^\\s\"'<>]*"), "$1?(left out)"},
      {pattern("\\?[^\\s\"'<>?=()]+=[^\\s\"'<>]*"), "?(left out)"},
      {pattern(std::string("(") + kSecretWord +
               "[\"']?\\s*[:=]\\s*)(?:\"(?:[^\"\\\\]|\\\\.)*\"?|'[^']*'?|(?:bearer|basic)\\s+\\S+|[^\\s,;}\\]"
               "]+)"),
       "$1(left out)"},
      {pattern("\\bbearer\\s+\\S+"), "Bearer (left out)"},
      {pattern("[^\\s@\"'<>(),;:=/\\[\\]{}]+@[^\\s@\"'<>(),;:=/\\[\\]{}]+"), "(address)"},
      {pattern("(/home/|/Users/)[^/\\s\"':,;]+"), "$1(user)"},
      {pattern("\\b[0-9a-f]{8}-(?:[0-9a-f]{4}-){3}[0-9a-f]{12}\\b"), "(UUID)"},
      {pattern("\\b[0-9a-f]{32,}\\b"), "(number)"},
      {pattern("\\b(?:[0-9a-f]{2}:){5}[0-9a-f]{2}\\b"), "(hardware address)"},
  };
  return kPatterns;
}

// "-----BEGIN … PRIVATE KEY-----" to the end of its block, or of the text.
std::string withoutPrivateKeys(std::string text) {
  constexpr std::string_view kMark = "PRIVATE KEY-----", kBegin = "-----BEGIN ";
  for (std::size_t from = 0;;) {
    const std::size_t begin = text.find(kBegin, from);
    if (begin == std::string::npos) return text;
    const std::size_t mark = text.find(kMark, begin);
    from = begin + kBegin.size();
    if (mark == std::string::npos || text.find('\n', begin) < mark) continue;
    const std::size_t end = text.find(kMark, mark + kMark.size());
    text.replace(begin, end == std::string::npos ? end : end + kMark.size() - begin, "(private key)");
  }
}

bool isPartOfWord(char c) {
  return std::isalnum(static_cast<unsigned char>(c)) || c == '_' || static_cast<unsigned char>(c) >= 0x80;
}

}  // namespace

// The longest first, because a full host name contains the short one.
Redaction::Redaction(std::vector<std::string> names)
    : _names([&] {
        std::erase_if(names, [](const std::string& name) { return name.size() < 2; });
        std::sort(names.begin(), names.end(),
                  [](const auto& a, const auto& b) { return a.size() > b.size(); });
        return std::move(names);
      }()) {}

std::string Redaction::text(std::string_view given) const {
  const std::string whole = withoutPrivateKeys(std::string(given));
  std::string out;
  for (std::size_t at = 0; at < whole.size();) {
    const std::size_t end = std::min(whole.find('\n', at), whole.size());
    out += line(whole.substr(at, end - at));
    if (end < whole.size()) out += '\n';
    at = end + 1;
  }
  return out;
}

std::string Redaction::line(std::string line) const {
  if (line.size() > kLongestShownLine) line = line.substr(0, kLongestShownLine) + "(rest left out)";
  for (const Pattern& one : patterns()) line = std::regex_replace(line, one.pattern, one.instead);
  return withoutNames(std::move(line));
}

std::string Redaction::withoutNames(std::string text) const {
  for (const std::string& name : _names) {
    for (std::size_t at = 0; (at = text.find(name, at)) != std::string::npos;) {
      const std::size_t end = at + name.size();
      const bool whole =
          (at == 0 || !isPartOfWord(text[at - 1])) && (end == text.size() || !isPartOfWord(text[end]));
      if (whole) text.replace(at, name.size(), "(name)");
      at += whole ? 6 : 1;
    }
  }
  return text;
}

Value Redaction::value(const Value& given) const {
  static const std::regex kSecret = pattern(kSecretWord);
  if (const std::string* content = given.asString()) return text(*content);
  if (given.asData()) return kLeftOut;
  if (const Array* array = given.asArray()) {
    Array kept;
    for (const Value& one : *array) kept.push_back(value(one));
    return kept;
  }
  const Dictionary* dictionary = given.asDictionary();
  if (!dictionary) return given;
  std::vector<Dictionary::Entry> kept;
  for (const auto& [key, inner] : *dictionary) {
    const bool secret = std::regex_search(key.substr(0, kLongestShownLine), kSecret);
    kept.emplace_back(text(key), secret ? Value(kLeftOut) : value(inner));
  }
  return Dictionary::fromEntries(std::move(kept));
}

std::vector<std::string> namesOfMachine() {
  // User names of services, which identify nobody.
  static const std::set<std::string> kKnown = {"root", "veltrad", "localhost", "nobody", "daemon"};
  constexpr uid_t kFirstPerson = 1000, kNobody = 65534;
  std::set<std::string> names;
  char host[256] = {};
  if (::gethostname(host, sizeof host - 1) == 0) {
    names.insert(host);
    names.insert(std::string(host).substr(0, std::string(host).find('.')));
  }
  ::setpwent();
  while (const passwd* user = ::getpwent()) {
    if (user->pw_uid >= kFirstPerson && user->pw_uid < kNobody) names.insert(user->pw_name);
  }
  ::endpwent();
  for (const char* variable : {"SUDO_USER", "USER", "LOGNAME"}) {
    if (const char* name = std::getenv(variable)) names.insert(name);
  }
  std::erase_if(names, [](const std::string& name) { return kKnown.contains(name); });
  return {names.begin(), names.end()};
}

}  // namespace veltrad::ctl
