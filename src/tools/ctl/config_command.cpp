// SPDX-License-Identifier: Apache-2.0
// `veltractl config`. Keys and values are judged here before anybody is asked, so that wrong usage is told
// apart.
#include "tools/ctl/commands.h"

#include <fmt/format.h>

#include <cmath>

#include "base/text.h"
#include "config/preference_keys.h"
#include "formats/json.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/preference_access.h"
#include "tools/ctl/print.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

using config::PreferenceKey;
using Use = PreferenceAccess::Use;

// Nothing: not set.
std::optional<Value> setValue(const Dictionary& key) {
  const Value* value = key.find("value");
  if (!value || (value->asReal() && std::isnan(*value->asReal()))) return std::nullopt;
  return *value;
}

std::string words(const Value& value) {
  if (value.isBoolean()) return *value.toBoolean() ? "true" : "false";
  const auto text = value.toText();
  return escapedForLog(text ? *text : formats::writeJSON(value));
}

const char* whenSeen(const PreferenceKey& key) {
  const bool now = key.effect == PreferenceKey::Effect::now;
  return now ? "for sessions that start from now on" : "at the next start";
}

Result<Dictionary, std::string> askedFor(const Options& options, Use use, const char* question,
                                         const Dictionary& arguments) {
  auto access = PreferenceAccess::open(options.root, use);
  if (!access) return Failure{access.error()};
  return access.value().ask(question, arguments);
}

int list(const Options& options) {
  const auto answer = askedFor(options, Use::read, wire::question::kConfig, {});
  if (!answer) return refused(answer.error());
  const Dictionary& keys = answer.value();
  return printed(options.json ? formats::writeJSON(keys) : formatPreferences(keys));
}

int get(const Options& options, const PreferenceKey& key) {
  const auto answer = askedFor(options, Use::read, wire::question::kConfig, {});
  if (!answer) return refused(answer.error());
  for (const Dictionary* found : dictionariesIn(answer.value(), "keys")) {
    const std::string* name = found->string("name");
    if (!name || *name != key.name()) continue;
    const auto value = setValue(*found);
    if (!value) break;
    return printed(options.json ? formats::writeJSON(*value) : words(*value));
  }
  return refused(fmt::format("{} is not set; default: {}", key.name(), key.byDefault));
}

int set(const Options& options, const PreferenceKey& key) {
  const std::string& text = options.care.value;
  const auto value = config::preferenceValue(key, text);
  if (!value) return refused(value.error(), kWrongUsage);
  const auto answer =
      askedFor(options, Use::change, wire::question::kSetConfig, {{"name", key.name()}, {"value", text}});
  if (!answer) return refused(answer.error());
  if (options.json)
    return printed(formats::writeJSON(Dictionary{{"name", key.name()}, {"value", value.value()}}));
  return printed(fmt::format("{} = {}: takes effect {}", key.name(), words(value.value()), whenSeen(key)));
}

int unset(const Options& options, const PreferenceKey& key) {
  const auto answer = askedFor(options, Use::change, wire::question::kUnsetConfig, {{"name", key.name()}});
  if (!answer) return refused(answer.error());
  const bool wasSet = answer.value().boolean("wasSet").value_or(true);
  if (options.json) return printed(formats::writeJSON(Dictionary{{"name", key.name()}, {"wasSet", wasSet}}));
  if (!wasSet) return printed(fmt::format("{} was not set", key.name()));
  return printed(fmt::format("{} is not set any more, default: {}: takes effect {}", key.name(),
                             key.byDefault, whenSeen(key)));
}

}  // namespace

std::string formatPreferences(const Dictionary& answer) {
  std::string out;
  for (const Dictionary* listed : dictionariesIn(answer, "keys")) {
    const std::string* name = listed->string("name");
    const PreferenceKey* key = name ? config::preferenceNamed(*name) : nullptr;
    if (!name) continue;
    const auto value = setValue(*listed);
    if (!out.empty()) out += '\n';
    out += escapedForLog(*name) + (value ? " = " + words(*value) : " is not set");
    if (!key) continue;  // of a newer daemon
    out += fmt::format("\n    {}.\n    {}, {}; default: {}; a change takes effect {}{}", key->meaning,
                       nameOf(key->type), key->range, key->byDefault,
                       key->effect == PreferenceKey::Effect::now ? "" : "at the ", nameOf(key->effect));
  }
  return out;
}

int runConfig(const Options& options) {
  if (options.command == Command::config) return list(options);
  const PreferenceKey* key = config::preferenceNamed(options.care.key);
  if (!key) return refused(config::unknownPreference(options.care.key), kWrongUsage);
  if (options.command == Command::configGet) return get(options, *key);
  return options.command == Command::configSet ? set(options, *key) : unset(options, *key);
}

}  // namespace veltrad::ctl
