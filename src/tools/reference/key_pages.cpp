// SPDX-License-Identifier: Apache-2.0
// Generates the parts of manual pages about keys, client types and reasons.
#include "tools/reference/key_pages.h"

#include <fmt/format.h>

#include <algorithm>
#include <vector>

#include "config/client_types.h"
#include "config/preference_keys.h"
#include "storebag/findings.h"
#include "tools/reference/markdown.h"
#include "wire/reasons.h"

namespace veltrad::reference {
namespace {

using config::Key;
using config::KeyTable;
using config::KeyType;

const char* nameOf(KeyType type) {
  switch (type) {
    case KeyType::text:
      return "text";
    case KeyType::url:
      return "text that begins with https://";
    case KeyType::names:
      return "text of names separated by commas";
    case KeyType::texts:
      return "array of texts";
    case KeyType::integer:
      return "integer";
    case KeyType::real:
      return "number";
    case KeyType::boolean:
      return "boolean";
    case KeyType::choice:
      return "text";
    case KeyType::presence:
      return "any value";
    case KeyType::dictionary:
      return "dictionary";
    case KeyType::dictionaries:
      return "array of dictionaries";
  }
  return "";
}

// "drawn|stable" as a person says it.
std::string choicesOf(const Key& key) {
  std::string text = "\"";
  for (const char c : std::string_view(key.choices)) text += c == '|' ? "\" or \"" : std::string(1, c);
  return text + "\"";
}

std::string item(const Key& key) {
  const bool required = key.need == config::Need::required;
  std::string type = nameOf(key.type);
  if (key.range.least < key.range.most) type += fmt::format(", {} to {}", key.range.least, key.range.most);
  if (key.choices) type = choicesOf(key);
  return fmt::format("- **{}** ({}{}): {} Without it: {}\n", escaped(key.name), type,
                     required ? ", required" : "", sentence(escaped(key.meaning)),
                     sentence(escaped(key.byDefault)));
}

// A table, and the keys whose dictionaries have it.
struct Level {
  const KeyTable* table;
  std::vector<const Key*> owners;
};

std::string heading(const Level& level) {
  std::string names;
  for (const Key* owner : level.owners)
    names += fmt::format("{}\"{}\"", names.empty() ? "" : ", ", owner->name);
  const bool elements = level.owners[0]->type == KeyType::dictionaries;
  return fmt::format("### Keys of {}{}\n\n", elements ? "each element of " : "", escaped(names));
}

}  // namespace

std::string keysOf(const KeyTable& table) {
  std::vector<Level> levels{{&table, {}}};
  std::string page;
  for (std::size_t i = 0; i < levels.size(); ++i) {
    if (i > 0) page += '\n' + heading(levels[i]);
    const KeyTable& keys = *levels[i].table;
    for (const Key& key : keys) {
      page += item(key);
      if (key.inner == nullptr) continue;
      const auto same = [&key](const Level& level) { return level.table == key.inner; };
      auto level = std::find_if(levels.begin(), levels.end(), same);
      if (level == levels.end()) level = levels.insert(levels.end(), {key.inner, {}});
      level->owners.push_back(&key);
    }
  }
  return page;
}

std::string preferences() {
  std::string page;
  for (const config::PreferenceKey& key : config::preferenceKeys()) {
    page += fmt::format("- **{}** ({}, {}; a change takes effect {}): {} Without it: {}\n",
                        escaped(key.name()), nameOf(key.type), key.range,
                        key.effect == config::PreferenceKey::Effect::now ? "now" : "at the next start",
                        sentence(escaped(key.meaning)), sentence(escaped(key.byDefault)));
  }
  return page;
}

std::string clientTypes() {
  std::string page = "| client type | storebag | sender code |\n|---|---|---|\n";
  for (std::int32_t type = 0; type < config::kVeltraClientTypeCount; ++type) {
    const char* storebag = config::storebagNameForClientType(type);
    page += fmt::format("| {} | {} | {} |\n", type, storebag ? storebag : "none",
                        config::senderCodeForComponentType(type));
  }
  return page;
}

std::string environments() {
  std::string page = "| environment | section |\n|---|---|\n| 0 | none |\n";
  for (std::uint32_t number = 1; const char* name = config::sectionNameForEnvironment(number); ++number)
    page += fmt::format("| {} | {} |\n", number, escaped(name));
  return page;
}

std::string findings() {
  std::string page;
  for (const storebag::FindingKind& kind : storebag::findingKinds())
    page += fmt::format("- **{}** ({}): {} {}\n", kind.name, storebag::textOf(kind.severity),
                        escaped(kind.meaning), escaped(kind.mend));
  return page;
}

std::string reasons() {
  std::string page;
  for (const auto& [concern, name, text] : wire::kReasons)
    page += fmt::format("- **{}**: {}\n", escaped(name), sentence(escaped(text)));
  return page;
}

}  // namespace veltrad::reference
