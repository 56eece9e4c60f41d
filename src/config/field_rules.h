// SPDX-License-Identifier: Apache-2.0
// Removes or hashes fields of messages as the owner's policy requires. Any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <unordered_set>

#include "base/value.h"
#include "config/field_changes.h"
#include "config/policy.h"

namespace veltrad::config {

// Immutable. Fields are found by name, ignoring letter case, at any depth of dictionaries and arrays. A field
// that is to be removed and hashed is removed.
class FieldRules {
 public:
  // `secret`: of this device; the key of the digests. Without one, fields that are to be hashed are removed.
  FieldRules(const PolicyRules& rules, std::optional<std::string> secret);

  bool madeWith(const std::optional<std::string>& secret) const { return secret == _secret; }
  bool empty() const { return _remove.empty() && _hash.empty(); }
  // True if a field of this name is removed.
  bool removes(std::string_view name) const;
  // Changes the message in place; one without such fields stays the same shared object.
  // False if there were none.
  bool apply(Dictionary& message, FieldChanges& changes) const;
  void apply(Value& value, FieldChanges& changes) const;
  // The value that stands for one that is to be hashed: the HMAC-SHA-256 of a text, or of the JSON text of
  // another scalar, as 64 hexadecimal digits. Absent if the value must be removed: data, dates, arrays and
  // dictionaries, and every value while there is no secret.
  std::optional<std::string> digest(const Value& value) const;

 private:
  enum class Rule { keep, remove, hash };
  Rule ruleOf(std::string_view name) const;
  // Absent if it holds no such field.
  std::optional<Dictionary> edited(const Dictionary& dictionary, FieldChanges& changes) const;
  std::optional<Value> edited(const Value& value, FieldChanges& changes) const;

  std::unordered_set<std::string> _remove;
  std::unordered_set<std::string> _hash;
  const std::optional<std::string> _secret;
};

}  // namespace veltrad::config
