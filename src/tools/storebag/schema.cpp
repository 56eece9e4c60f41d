// SPDX-License-Identifier: Apache-2.0
// Converts the tables of keys to JSON Schema.
#include "storebag/schema.h"

#include <fmt/format.h>

#include <map>
#include <string>

#include "config/storebag_content.h"
#include "storebag/value_check.h"

namespace veltrad::storebag {
namespace {

using config::Key;
using config::KeyTable;
using config::KeyType;

// The form of a text, and what editors say of another one.
struct Form {
  const char* pattern;
  const char* expected;
};
constexpr Form kNames{R"(^[^,\s]([^,]*[^,\s])?(,[^,\s]([^,]*[^,\s])?)*$)",
                      "Write names with commas between them, without blanks: \"phone,lamp\"."};
constexpr Form kName{R"(^\S(.*\S)?$)", "Write a name without blanks around it."};
constexpr Form kAddress{R"(^[hH][tT][tT][pP][sS]://[^\s/?#@]+([/?#]\S*)?$)",
                        "Write https://HOST/PATH, without a user's name."};
constexpr Form kAddressWithoutQuery{R"(^[hH][tT][tT][pP][sS]://[^\s/?#@]+(/[^\s?#]*)?$)",
                                    "Write https://HOST/PATH, without a user's name and a query."};
constexpr Form kIPv4{R"(^((25[0-5]|2[0-4][0-9]|1[0-9]{2}|[1-9]?[0-9])(\.(?!$)|$)){4}$)",
                     "Write an IPv4 address in decimal, like \"192.0.2.7\"."};

Dictionary textOfForm(const Form& form) {
  return {{"type", "string"}, {"pattern", form.pattern}, {"patternErrorMessage", form.expected}};
}

bool is(const Key& key, const char* name) {
  return key.name == std::string_view(name);
}

class Schema {
 public:
  Dictionary make() {
    Dictionary schema = objectOf(config::Storebag::kKeys);
    schema.merge({{"$schema", "http://json-schema.org/draft-07/schema#"},
                  {"title", "Storebag of veltrad"},
                  {"definitions", Dictionary::fromEntries({_definitions.begin(), _definitions.end()})}});
    return schema;
  }

 private:
  Dictionary objectOf(const KeyTable& table) {
    std::vector<Dictionary::Entry> properties;
    Array required;
    for (const Key& key : table) {
      Dictionary property = propertyOf(table, key);
      property.set("description", fmt::format("{} Without it: {}.", key.meaning, key.byDefault));
      properties.emplace_back(key.name, std::move(property));
      const bool isAction = &table == &config::filterTag::kKeys && is(key, "action");
      if (key.need == config::Need::required || isAction) required.emplace_back(key.name);
    }
    Dictionary object{{"type", "object"},
                      {"properties", Dictionary::fromEntries(std::move(properties))},
                      {"additionalProperties", false}};
    if (!required.empty()) object.set("required", std::move(required));
    if (&table == &config::ClientEntry::kKeys)
      object.set("anyOf", Array{Dictionary{{"required", Array{"sampling_threshold"}}},
                                Dictionary{{"required", Array{"per_country_sampling_thresholds"}}}});
    return object;
  }

  Dictionary propertyOf(const KeyTable& table, const Key& key) {
    switch (key.type) {
      case KeyType::text:
        return textOf(table, key);
      case KeyType::url:
        return textOfForm(&table == &config::UploadProfile::kKeys ? kAddressWithoutQuery : kAddress);
      case KeyType::names:
        return textOfForm(kNames);
      case KeyType::texts:
        return listOf(textOfForm(kName), key.need == config::Need::required);
      case KeyType::integer:
        return numberOf(key, Array{"integer", "boolean"});
      case KeyType::real:
        return numberOf(key, Array{"number", "boolean"});
      case KeyType::presence:
        return isBounded(key.range) ? numberOf(key, "number") : Dictionary();
      case KeyType::dictionary:
        return key.inner ? Dictionary{{"allOf", Array{referenceTo(key)}}} : Dictionary{{"type", "object"}};
      case KeyType::dictionaries:
        return listOf(referenceTo(key), is(key, "clients"));
      case KeyType::boolean:
        return {{"type", "boolean"}};
      case KeyType::choice:
        break;
    }
    return {{"type", "string"}};
  }

  static Dictionary textOf(const KeyTable& table, const Key& key) {
    if (&table == &config::DashboardProfile::kKeys && is(key, "ip")) return textOfForm(kIPv4);
    if (&table == &config::filterTag::kKeys && is(key, "key")) return textOfForm(kName);
    if (&table == &config::filterTag::kKeys && is(key, "action"))
      return {{"enum", Array{"remove", "sha256", "keep"}}};
    return {{"type", "string"}};
  }

  static Dictionary listOf(Dictionary items, bool needsOne) {
    Dictionary list{{"type", "array"}, {"items", std::move(items)}};
    if (needsOne) list.set("minItems", 1);
    return list;
  }

  static Dictionary numberOf(const Key& key, Value type) {
    const config::Range& range = sensibleRange(key);
    Dictionary number{{"type", std::move(type)}};
    if (!isBounded(range)) return number;
    const auto whole = [](double bound) { return Value(static_cast<long>(bound)); };
    if (range.least > config::kInt32.least) number.set("minimum", whole(range.least));
    number.set("maximum", whole(range.most));
    return number;
  }

  // The keys of a table stand once, under the name of the first key that has them.
  Dictionary referenceTo(const Key& key) {
    auto name = _names.find(key.inner);
    if (name == _names.end()) {
      name = _names.emplace(key.inner, key.name).first;
      _definitions.insert_or_assign(key.name, Value(objectOf(*key.inner)));
    }
    return {{"$ref", "#/definitions/" + name->second}};
  }

  std::map<const KeyTable*, std::string> _names;
  std::map<std::string, Value> _definitions;
};

}  // namespace

Dictionary schemaOfStorebags() {
  return Schema().make();
}

}  // namespace veltrad::storebag
