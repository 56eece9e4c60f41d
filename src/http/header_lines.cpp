// SPDX-License-Identifier: Apache-2.0
// Cleans headers.
#include "http/header_lines.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <utility>

#include "base/text.h"

namespace veltrad::http {

namespace {

bool isControlCharacter(char c) {
  return static_cast<unsigned char>(c) < 0x20 || c == 0x7f;
}

// A token (RFC 9110, 5.6.2).
bool isToken(std::string_view name) {
  const auto allowed = [](char c) {
    const auto byte = static_cast<unsigned char>(c);
    return byte < 0x80 &&
           (std::isalnum(byte) != 0 || std::string_view("!#$%&'*+-.^_`|~").find(c) != std::string_view::npos);
  };
  return !name.empty() && std::all_of(name.begin(), name.end(), allowed);
}

// "name: value", or "name;" for an empty value, as libcurl expects it.
std::string headerLine(std::string_view name, std::string_view value) {
  std::string clean(value);
  clean.erase(std::remove_if(clean.begin(), clean.end(), isControlCharacter), clean.end());
  clean.erase(0, clean.find_first_not_of(' '));
  std::string line(name);
  return clean.empty() ? line + ";" : line + ": " + clean;
}

}  // namespace

std::vector<std::string> headerLines(const HTTPHeaders& headers, std::uint64_t bodySize) {
  std::vector<std::string> lines;
  // Headers that libcurl would add unless the request has them.
  std::array<std::pair<const char*, bool>, 2> own{{{"Accept", false}, {"Content-Type", false}}};
  bool lengthSaid = false;  // the request's own Content-Length only sets its position
  for (const auto& [name, value] : headers) {
    const std::string_view given = name;
    const auto is = [given](const char* other) { return equalIgnoringCase(given, other); };
    if (!isToken(given) || is("Transfer-Encoding") || is("Expect")) continue;
    for (auto& [automatic, found] : own) found = found || is(automatic);
    if (is("Content-Length")) {
      if (!std::exchange(lengthSaid, true))
        lines.push_back(headerLine("Content-Length", std::to_string(bodySize)));
    } else {
      lines.push_back(headerLine(name, value));
    }
  }
  for (const auto& [automatic, found] : own) {
    if (!found) lines.push_back(std::string(automatic) + ":");
  }
  lines.emplace_back("Expect:");
  return lines;
}

std::vector<std::string> sentLines(const std::string& host, std::vector<std::string> lines) {
  std::vector<std::string> sent{"Host: " + host};
  for (std::string& line : lines) {
    const std::size_t colon = line.find(':');
    if (colon + 1 == line.size()) continue;
    if (colon == std::string::npos) line.back() = ':';
    sent.push_back(std::move(line));
  }
  return sent;
}

}  // namespace veltrad::http
