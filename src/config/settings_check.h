// SPDX-License-Identifier: Apache-2.0
// Compares a settings file with the table of its keys. A plain function; any thread.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "config/key_table.h"

namespace veltrad::platform {
struct LocalContent;
}  // namespace veltrad::platform

namespace veltrad::config {

struct SettingsFindings {
  // "PATH:LINE:COLUMN: text": no dictionary, a value of a wrong type or out of its range. The first found.
  std::optional<std::string> error;
  // The same form: keys that the table does not have.
  std::vector<std::string> warnings;
};

// `content` is good. Stricter than the parser of storebags: a type is met exactly.
SettingsFindings checkSettings(const platform::LocalContent& content, const KeyTable& table);

}  // namespace veltrad::config
