// SPDX-License-Identifier: Apache-2.0
// Removes secrets and names of people and machines from a text that is to be passed on. Any thread.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "base/value.h"

namespace veltrad::ctl {

// Replaces each removed part by its kind in parentheses.
class Redaction {
 public:
  // `names`: of this machine and its users, removed where they are whole words.
  explicit Redaction(std::vector<std::string> names);

  // Private keys; user names, passwords, queries and fragments of URLs; e-mail addresses; home directories;
  // values that follow words like "token" or "password"; UUIDs, hardware addresses and long hexadecimal
  // numbers; the names.
  std::string text(std::string_view text) const;
  // Also removes every value whose key contains such a word.
  Value value(const Value& value) const;

 private:
  std::string line(std::string line) const;
  std::string withoutNames(std::string text) const;

  const std::vector<std::string> _names;
};

// The machine's own names, and those of its people as far as the user database lists them.
std::vector<std::string> namesOfMachine();

}  // namespace veltrad::ctl
