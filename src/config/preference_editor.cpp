// SPDX-License-Identifier: Apache-2.0
// Uses the table of preferences and the preference files.
#include "config/preference_editor.h"

#include "base/null_value.h"
#include "platform/preferences.h"

namespace veltrad::config {

namespace {

Result<const PreferenceKey*, std::string> keyOf(const Dictionary& arguments) {
  const std::string* name = arguments.string("name");
  if (!name) return Failure{std::string("argument \"name\" must be a text")};
  const PreferenceKey* key = preferenceNamed(*name);
  if (!key) return Failure{unknownPreference(*name)};
  return key;
}

}  // namespace

Result<std::optional<Value>, std::string> PreferenceEditor::stored(const PreferenceKey& key) {
  auto found = _preferences.lookUp(key.domain, key.key);
  if (!found) return Failure{"The preferences cannot be read just now: " + found.error().description};
  return std::move(found.value());
}

PreferenceEditor::Answer PreferenceEditor::list() {
  Array keys;
  for (const PreferenceKey& key : preferenceKeys()) {
    const auto value = stored(key);
    if (!value) return Failure{value.error()};
    keys.push_back(Dictionary{{"name", key.name()},
                              {"domain", key.domain},
                              {"type", nameOf(key.type)},
                              {"value", orNull(value.value())},
                              {"default", key.defaultValue(_device.isInternalBuild())},
                              {"effect", nameOf(key.effect)}});
  }
  return Dictionary{{"keys", std::move(keys)}};
}

PreferenceEditor::Answer PreferenceEditor::set(const Dictionary& arguments) {
  const auto key = keyOf(arguments);
  if (!key) return Failure{key.error()};
  const std::string* text = arguments.string("value");
  if (!text) return Failure{std::string("argument \"value\" must be a text")};
  const auto value = preferenceValue(*key.value(), *text);
  if (!value) return Failure{value.error()};
  const auto changed = _preferences.change(key.value()->domain, key.value()->key, value.value());
  if (!changed) return Failure{changed.error()};
  return Dictionary();
}

PreferenceEditor::Answer PreferenceEditor::unset(const Dictionary& arguments) {
  const auto key = keyOf(arguments);
  if (!key) return Failure{key.error()};
  const auto before = stored(*key.value());
  if (!before) return Failure{before.error()};
  const auto changed = _preferences.change(key.value()->domain, key.value()->key, std::nullopt);
  if (!changed) return Failure{changed.error()};
  return Dictionary{{"wasSet", before.value().has_value()}};
}

}  // namespace veltrad::config
