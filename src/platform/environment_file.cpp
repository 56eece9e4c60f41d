// SPDX-License-Identifier: Apache-2.0
// Parses NAME=value lines.
#include "platform/environment_file.h"

#include "base/text.h"

namespace veltrad::platform {

namespace {

std::string unquoted(std::string_view value) {
  const char quote = value.empty() ? '\0' : value.front();
  const bool quoted = value.size() >= 2 && (quote == '"' || quote == '\'') && value.back() == quote;
  if (quoted) value = value.substr(1, value.size() - 2);
  std::string plain;
  for (std::size_t i = 0; i < value.size(); ++i) {
    if (value[i] == '\\' && !(quoted && quote == '\'') && i + 1 < value.size()) ++i;
    plain += value[i];
  }
  return plain;
}

}  // namespace

std::optional<std::string> valueInEnvironmentFile(std::string_view text, std::string_view name) {
  std::optional<std::string> found;
  while (!text.empty()) {
    const auto end = text.find('\n');
    const std::string_view line = trimmed(text.substr(0, end));
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    const auto equals = line.find('=');
    if (equals != std::string_view::npos && line.substr(0, equals) == name) {
      found = unquoted(trimmed(line.substr(equals + 1)));
    }
  }
  return found && found->empty() ? std::nullopt : found;
}

}  // namespace veltrad::platform
