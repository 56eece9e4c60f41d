// SPDX-License-Identifier: Apache-2.0
// Takes secrets, and what names people and machines, out of a text that is to be passed on. Any thread.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "base/value.h"

namespace veltrad::ctl {

// What was taken out is named in parentheses in its place.
class Redaction {
 public:
  // `names`: of this machine and its people, taken out where they stand as whole words.
  explicit Redaction(std::vector<std::string> names);

  // Private keys; user names, passwords, queries and fragments of URLs; e-mail addresses; home directories;
  // values that follow words like "token" or "password"; UUIDs, hardware addresses and long hexadecimal
  // numbers; the names.
  std::string text(std::string_view text) const;
  // Also whatever stands under a key that has such a word in it.
  Value value(const Value& value) const;

 private:
  std::string line(std::string line) const;
  std::string withoutNames(std::string text) const;

  const std::vector<std::string> _names;
};

// The machine's own names, and those of its people as far as the user database lists them.
std::vector<std::string> namesOfMachine();

}  // namespace veltrad::ctl
