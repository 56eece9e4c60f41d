// SPDX-License-Identifier: Apache-2.0
// Compares one value with its key's row in the tables.
#pragma once

#include <string>

#include "config/key_table.h"
#include "storebag/lint_sink.h"

namespace veltrad::storebag {

class ValueCheck {
 public:
  // `lab`: as in LintOptions. The sink outlives it.
  ValueCheck(LintSink& sink, bool lab) : _sink(sink), _lab(lab) {}

  // `at` is the key's.
  void check(const Spot& at, const config::Key& key, const Value& value) const;
  // Of an array where a dictionary should stand.
  void sayNoDictionary(const Spot& at, const Value& value) const;

 private:
  bool isPlaceholder(const config::Key& key, const Value& value) const;
  void sayWrongType(const Spot& at, const config::Key& key, const Value& value) const;
  void checkNumber(const Spot& at, const config::Key& key, const Value& value) const;
  void checkPresence(const Spot& at, const config::Key& key, const Value& value) const;
  void checkNames(const Spot& at, const config::Key& key, const std::string& text) const;
  void checkTexts(const Spot& at, const config::Key& key, const Array& texts) const;
  void checkText(const Spot& at, const config::Key& key, const std::string& text) const;
  void checkWildcard(const Spot& at, const config::Key& key, const std::string& name) const;
  void checkName(const Spot& at, const config::Key& key, const std::string& name) const;
  void checkAddress(const Spot& at, const config::Key& key, const std::string& address) const;

  LintSink& _sink;
  const bool _lab;
};

// What a value of this type is: "a text".
const char* typeText(config::KeyType type);
// The range that has a meaning: " from 0 to 1"; empty if the key has none.
std::string rangeText(const config::Key& key);
// The range that tools go by.
const config::Range& sensibleRange(const config::Key& key);
bool isBounded(const config::Range& range);

}  // namespace veltrad::storebag
