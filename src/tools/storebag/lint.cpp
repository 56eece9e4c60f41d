// SPDX-License-Identifier: Apache-2.0
// Finds mistakes in a storebag. Like the daemon, it treats a value of the wrong type as absent.
#include "storebag/lint.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>

#include "base/text.h"
#include "config/storebag_content.h"
#include "formats/json.h"

namespace veltrad::storebag {
namespace {

using config::Key;
using config::KeyTable;
using config::KeyType;

constexpr const char* kNobody = "refuses every client that requires user info";

// In the order of KeyType.
constexpr const char* kTypeNames[] = {"a text",   "a text",        "a text",   "an array of texts",
                                      "a number", "a number",      "anything", "a dictionary",
                                      "an array", "true or false", "a text"};
static_assert(std::size(kTypeNames) == static_cast<std::size_t>(KeyType::choice) + 1);

bool holdsText(const Array& array) {
  return std::any_of(array.begin(), array.end(), [](const Value& item) { return item.asString(); });
}

bool outside(const config::Range& range, const Value& number) {
  const double read = number.toDouble().value_or(0);
  return range.least < range.most && (read < range.least || read > range.most);
}

std::string quoted(const std::string& text) {
  return formats::writeJSON(Value(text));
}

class Lint {
 public:
  void checkStorebag(const Dictionary& storebag) {
    check("storebag", "section or key", storebag, config::Storebag::kKeys);
  }
  std::vector<std::string> take() { return std::move(_findings); }

 private:
  void say(const std::string& place, const std::string& what) { _findings.push_back(place + ": " + what); }

  void check(const std::string& place, const char* what, const Dictionary& dictionary,
             const KeyTable& table) {
    for (const auto& [name, value] : dictionary) {
      if (const Key* key = table.find(name))
        checkValue(place, *key, value);
      else
        sayUnknown(place, what, name, table);
    }
    for (const Key& key : table)
      if (key.need == config::Need::required) checkRequired(place, key, dictionary.find(key.name));
    checkWhole(place, dictionary, table);
    for (const Key& key : table) {
      const Value* value = key.inner != nullptr ? dictionary.find(key.name) : nullptr;
      if (value == nullptr) continue;
      const bool isSection = &table == &config::Storebag::kKeys;
      const std::string at = isSection ? key.name : place + "." + key.name;
      if (const Dictionary* inner = value->asDictionary(); inner && key.type == KeyType::dictionary)
        check(at, isSection ? "back end" : "key", *inner, *key.inner);
      else if (const Array* elements = value->asArray(); elements && key.type == KeyType::dictionaries)
        checkElements(at, *elements, *key.inner);
    }
  }

  void sayUnknown(const std::string& place, const char* what, const std::string& name,
                  const KeyTable& table) {
    std::string expected;
    for (const Key& key : table) expected += (expected.empty() ? "" : ", ") + std::string(key.name);
    say(place, fmt::format("unknown {} {}: expected one of {}", what, quoted(name), expected));
  }

  void checkValue(const std::string& place, const Key& key, const Value& value) {
    const std::string name = quoted(key.name);
    if (!config::fits(value, key.type))
      return say(place, fmt::format("{} is not {}: counts as absent", name,
                                    kTypeNames[static_cast<std::size_t>(key.type)]));
    if (key.type == KeyType::texts) {
      for (const Value& item : *value.asArray())
        if (!item.asString())
          say(place, fmt::format("{} holds {}, which is no text", name, formats::writeJSON(item)));
    } else if (key.type == KeyType::url && !lowerCase(*value.asString()).starts_with("https://")) {
      say(place, fmt::format("{} does not begin with https://: nothing is posted to {}", name,
                             quoted(*value.asString())));
    } else if ((key.type == KeyType::integer || key.type == KeyType::real) && outside(key.range, value)) {
      say(place, fmt::format("{} is {}: expected {:.0f} to {:.0f}", name, formats::writeJSON(value),
                             key.range.least, key.range.most));
    }
  }

  void checkRequired(const std::string& place, const Key& key, const Value* value) {
    const bool given = value != nullptr && config::fits(*value, key.type);
    if (key.type == KeyType::texts) {  // required lists are of countries
      if (!given || !holdsText(*value->asArray()))
        say(place, fmt::format("no country in \"{}\": {}", key.name, key.byDefault));
    } else if (!given) {
      say(place, fmt::format("no \"{}\": {}", key.name, key.byDefault));
    }
  }

  // Checks what depends on several keys.
  void checkWhole(const std::string& place, const Dictionary& dictionary, const KeyTable& table) {
    if (&table == &config::HTTPSPostProfile::kKeys) {
      const Array* clients = dictionary.array("clients");
      if (clients != nullptr && clients->empty())
        say(place, fmt::format("\"clients\" is empty: {}, and has no URL for the others", kNobody));
    } else if (&table == &config::ClientEntry::kKeys) {
      const Array* countries = dictionary.array("per_country_sampling_thresholds");
      if (!dictionary.real("sampling_threshold") && (countries == nullptr || countries->empty()))
        say(place, fmt::format("no \"sampling_threshold\", not even for a country: {}", kNobody));
    } else if (&table == &config::filterTag::kKeys) {
      checkAction(place, dictionary.string("action"));
    }
  }

  void checkAction(const std::string& place, const std::string* action) {
    const auto isNamed = [action](const auto& known) { return *action == known.first; };
    if (action == nullptr ||
        std::any_of(std::begin(config::kFilterActions), std::end(config::kFilterActions), isNamed))
      return;
    say(place,
        fmt::format("unknown \"action\" {}: the field is kept; expected remove or sha256", quoted(*action)));
  }

  void checkElements(const std::string& place, const Array& elements, const KeyTable& table) {
    // The place of the first client entry that matches every client.
    std::string everyones;
    for (std::size_t i = 0; i < elements.size(); ++i) {
      const std::string at = fmt::format("{}[{}]", place, i);
      const Dictionary* element = elements[i].asDictionary();
      if (element == nullptr) {
        say(at, "is not a dictionary: passed over");
        continue;
      }
      if (!everyones.empty())
        say(at,
            fmt::format("never used for a client that requires user info: {} matches everyone", everyones));
      else if (&table == &config::ClientEntry::kKeys && !element->string("client") &&
               !element->string("service"))
        everyones = at;
      check(at, "key", *element, table);
    }
  }

  std::vector<std::string> _findings;
};

}  // namespace

std::vector<std::string> lintStorebag(const Dictionary& storebag) {
  Lint lint;
  lint.checkStorebag(storebag);
  return lint.take();
}

}  // namespace veltrad::storebag
