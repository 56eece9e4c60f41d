// SPDX-License-Identifier: Apache-2.0
// Finds the fields that the owner's policy names, and writes their digests. Any thread.
#include "config/field_rules.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <cmath>
#include <cstdlib>
#include <optional>
#include <utility>
#include <vector>

#include "base/text.h"
#include "formats/json.h"

namespace veltrad::config {
namespace {

std::unordered_set<std::string> lowered(const TextList& names) {
  std::unordered_set<std::string> set;
  for (const std::string& name : names.texts) set.insert(lowerCase(name));
  return set;
}

}  // namespace

FieldRules::FieldRules(const PolicyRules& rules, std::optional<std::string> secret)
    : _remove(lowered(rules.remove)), _hash(lowered(rules.hash)), _secret(std::move(secret)) {}

FieldRules::Rule FieldRules::ruleOf(std::string_view name) const {
  const std::string key = lowerCase(name);
  if (_remove.contains(key)) return Rule::remove;
  return _hash.contains(key) ? Rule::hash : Rule::keep;
}

bool FieldRules::removes(std::string_view name) const {
  return ruleOf(name) == Rule::remove;
}

std::optional<std::string> FieldRules::digest(const Value& value) const {
  if (!_secret) return std::nullopt;
  std::string text;
  switch (value.type()) {
    case Value::Type::string:
      text = *value.asString();
      break;
    case Value::Type::real:
      if (!std::isfinite(*value.asReal())) return std::nullopt;
      [[fallthrough]];
    case Value::Type::boolean:
    case Value::Type::signedInteger:
    case Value::Type::unsignedInteger:
      text = formats::writeJSON(value);
      break;
    default:
      return std::nullopt;
  }
  unsigned char bytes[32];
  unsigned length = 0;
  if (HMAC(EVP_sha256(), _secret->data(), static_cast<int>(_secret->size()),
           reinterpret_cast<const unsigned char*>(text.data()), text.size(), bytes, &length) == nullptr)
    std::abort();
  return hex({reinterpret_cast<const char*>(bytes), length});
}

bool FieldRules::apply(Dictionary& message, FieldChanges& changes) const {
  auto changed = empty() ? std::nullopt : edited(message, changes);
  if (changed) message = std::move(*changed);
  return changed.has_value();
}

void FieldRules::apply(Value& value, FieldChanges& changes) const {
  if (auto changed = edited(value, changes)) value = std::move(*changed);
}

std::optional<Dictionary> FieldRules::edited(const Dictionary& dictionary, FieldChanges& changes) const {
  std::vector<Dictionary::Entry> entries;
  bool changed = false;
  for (const auto& [name, value] : dictionary) {
    const Rule rule = ruleOf(name);
    if (rule == Rule::keep) {
      auto inner = edited(value, changes);
      changed = changed || inner.has_value();
      entries.emplace_back(name, inner ? std::move(*inner) : Value(value));
      continue;
    }
    changed = true;
    if (auto text = rule == Rule::hash ? digest(value) : std::nullopt) {
      changes.changed(FieldChange::hashed, name);
      entries.emplace_back(name, Value(std::move(*text)));
    } else {
      changes.changed(FieldChange::removed, name);
    }
  }
  if (!changed) return std::nullopt;
  return Dictionary::fromEntries(std::move(entries));
}

std::optional<Value> FieldRules::edited(const Value& value, FieldChanges& changes) const {
  if (const Dictionary* dictionary = value.asDictionary()) {
    auto inner = edited(*dictionary, changes);
    return inner ? std::optional<Value>(std::move(*inner)) : std::nullopt;
  }
  const Array* array = value.asArray();
  if (array == nullptr) return std::nullopt;
  std::optional<Array> copy;
  for (std::size_t i = 0; i < array->size(); ++i) {
    auto inner = edited((*array)[i], changes);
    if (!inner) continue;
    if (!copy) copy = *array;
    (*copy)[i] = std::move(*inner);
  }
  return copy ? std::optional<Value>(std::move(*copy)) : std::nullopt;
}

}  // namespace veltrad::config
