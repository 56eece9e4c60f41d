// SPDX-License-Identifier: Apache-2.0
// Checks a storebag against the tables with which the daemon reads it.
#include "storebag/lint.h"

#include <fmt/format.h>

#include <algorithm>
#include <cctype>
#include <set>

#include "config/storebag_content.h"
#include "config/storebag_verdict.h"
#include "storebag/address_check.h"
#include "storebag/entry_check.h"
#include "storebag/spelling.h"
#include "storebag/value_check.h"
#include "storebag/words.h"

namespace veltrad::storebag {
namespace {

using config::Key;
using config::KeyTable;
using config::KeyType;
using enum FindingName;

std::vector<std::string> namesOf(const KeyTable& table, bool sectionsOnly) {
  std::vector<std::string> names;
  for (const Key& key : table)
    if (!sectionsOnly || key.inner) names.emplace_back(key.name);
  return names;
}

// In lower case for use within a sentence; "UDP port" keeps its capitals.
std::string withinSentence(std::string text) {
  const bool isWord = text.size() > 1 && std::islower(static_cast<unsigned char>(text[1])) != 0;
  return isWord ? lowerCase(text.substr(0, 1)) + text.substr(1) : text;
}

FindingName unknownIn(const KeyTable& table, const Value* value) {
  if (&table == &config::StorebagSection::kKeys) return unknown_backend;
  const bool isSection = &table == &config::Storebag::kKeys && value != nullptr && value->asDictionary();
  return isSection ? unknown_section : unknown_key;
}

const char* nounOf(FindingName unknown) {
  return unknown == unknown_section ? "section" : unknown == unknown_backend ? "back end" : "key";
}

// The keys that a misnamed entry probably has.
const KeyTable* likelyTable(FindingName unknown, const Dictionary& content) {
  if (unknown == unknown_section) return &config::StorebagSection::kKeys;
  if (unknown != unknown_backend) return nullptr;
  if (content.contains("clients")) return &config::HTTPSPostProfile::kKeys;
  return content.contains("ip") ? &config::DashboardProfile::kKeys : nullptr;
}

class Lint {
 public:
  explicit Lint(const LintOptions& options) : _lab(options.lab) {}

  void checkDictionary(const Spot& at, const Dictionary& dictionary, const KeyTable& table) {
    sayDuplicates(at);
    // Keys that are present under another name, or without a value.
    std::set<std::string> misnamed;
    for (const std::string& name : allNames(at, dictionary)) {
      const Value* value = dictionary.find(name);
      const Key* key = table.find(name);
      if (key == nullptr) {
        key = checkUnknown(at, name, value, table);
        if (key) misnamed.insert(key->name);
      } else if (value == nullptr) {
        _sink.say(wrong_type, at.key(name), fmt::format("{} is null and counts as absent", quoted(name)),
                  "Take the key out, or give it a value.");
        misnamed.insert(name);
      } else {
        checkValue(_sink, _lab, at.key(name), *key, *value);
      }
      if (key && value) checkInside(at.key(name), *key, *value);
    }
    for (const Key& key : table)
      if (key.need == config::Need::required && !misnamed.contains(key.name))
        checkRequired(at, key, dictionary.find(key.name));
    checkWhole(at, dictionary, table, misnamed);
  }

  std::vector<Finding> take() { return _sink.take(); }
  LintSink& sink() { return _sink; }

 private:
  // All keys, also those with a null value.
  static std::set<std::string> allNames(const Spot& at, const Dictionary& dictionary) {
    std::set<std::string> names;
    for (const auto& [name, value] : dictionary) names.insert(name);
    if (at.inside)
      for (const auto& member : at.inside->members) names.insert(member.key);
    return names;
  }

  void sayDuplicates(const Spot& at) {
    if (at.inside == nullptr) return;
    std::map<std::string_view, TextPlace> seen;
    for (const auto& member : at.inside->members) {
      const auto [first, isNew] = seen.emplace(member.key, member.place);
      if (isNew) continue;
      Spot spot = at.key(member.key);
      spot.place = member.place;
      _sink.say(duplicate_key, spot,
                fmt::format("{} stands in line {}, too, and the last one counts", quoted(member.key),
                            first->second.line));
    }
  }

  // The key that was probably meant, or null.
  const Key* checkUnknown(const Spot& at, const std::string& name, const Value* value,
                          const KeyTable& table) {
    if (&table == &config::Storebag::kKeys) {
      if (const Key* backend = config::StorebagSection::kKeys.find(name)) {
        _sink.say(unknown_section, at.key(name),
                  fmt::format("{} is a back end, and stands in no section", quoted(name)),
                  fmt::format("Put it into one: \"release\": {{{}: …}}.", quoted(name)));
        return backend;
      }
    }
    const FindingName unknown = unknownIn(table, value);
    const std::vector<std::string> known = namesOf(table, unknown == unknown_section);
    const auto meant = closestName(name, known);
    const Key* key = meant ? table.find(*meant) : nullptr;
    _sink.say(
        unknown, at.key(name),
        meant ? fmt::format("unknown {} {}: did you mean {}?", nounOf(unknown), quoted(name), quoted(*meant))
              : fmt::format("unknown {} {}", nounOf(unknown), quoted(name)),
        meant ? fmt::format("Write {}.", quoted(*meant))
              : fmt::format("Take it out, or use one of {}.", listed(known)));
    const Dictionary* content = value ? value->asDictionary() : nullptr;
    if (content == nullptr || (key && key->inner)) return key;
    if (const KeyTable* likely = likelyTable(unknown, *content))
      checkDictionary(at.key(name), *content, *likely);
    return key && !key->inner ? nullptr : key;
  }

  void checkInside(const Spot& at, const Key& key, const Value& value) {
    if (key.inner == nullptr) return;
    if (const Dictionary* inner = value.asDictionary(); inner && key.type == KeyType::dictionary)
      checkDictionary(at, *inner, *key.inner);
    else if (const Array* elements = value.asArray(); elements && key.type == KeyType::dictionaries)
      checkElements(at, *elements, *key.inner);
  }

  void checkElements(const Spot& at, const Array& elements, const KeyTable& table) {
    for (std::size_t i = 0; i < elements.size(); ++i) {
      if (const Dictionary* element = elements[i].asDictionary())
        checkDictionary(at.element(i), *element, table);
      else
        _sink.say(wrong_type, at.element(i),
                  fmt::format("{} is no dictionary, and is passed over", shownValue(elements[i])),
                  "Take it out, or put a dictionary there.");
    }
    if (&table == &config::ClientEntry::kKeys) checkEntries(_sink, at, elements);
    if (&table == &config::filterTag::kKeys) checkFilters(_sink, at, elements);
  }

  void checkRequired(const Spot& at, const Key& key, const Value* value) {
    if (value == nullptr)
      return _sink.say(missing_key, at, fmt::format("no \"{}\": {}", key.name, key.byDefault),
                       fmt::format("Add \"{}\": {}", key.name, withinSentence(key.meaning)));
    const Array* list = key.type == KeyType::texts ? value->asArray() : nullptr;
    if (list && list->empty())
      _sink.say(missing_key, at.key(key.name),
                fmt::format("no country in \"{}\": {}", key.name, key.byDefault),
                "Name the countries: [\"US\"].");
    const Array* entries = key.type == KeyType::dictionaries && key.inner == &config::ClientEntry::kKeys
                               ? value->asArray()
                               : nullptr;
    if (entries && entries->empty())
      _sink.say(
          missing_key, at.key(key.name),
          "no entry in \"clients\": refuses every client that requires user info, and has no address for "
          "the others",
          "Add an entry, or take the back end out.");
  }

  // Checks that concern several keys.
  void checkWhole(const Spot& at, const Dictionary& dictionary, const KeyTable& table,
                  const std::set<std::string>& misnamed) {
    if (&table == &config::ClientEntry::kKeys) {
      const Array* countries = dictionary.array("per_country_sampling_thresholds");
      const bool given = dictionary.contains("sampling_threshold") || (countries && !countries->empty()) ||
                         misnamed.contains("sampling_threshold") ||
                         misnamed.contains("per_country_sampling_thresholds");
      if (!given)
        _sink.say(
            missing_key, at,
            "no \"sampling_threshold\", not even for a country: refuses every client that requires user "
            "info",
            "Add \"sampling_threshold\": 1 for every device, 0.1 for every tenth.");
      checkConsent(_sink, at, dictionary);
    } else if (&table == &config::DashboardProfile::kKeys) {
      checkDashboard(at, dictionary);
    } else if (&table == &config::UploadProfile::kKeys) {
      const std::string* address = dictionary.string("post_url");
      if (address && address->find_first_of("?#") != std::string::npos)
        _sink.say(bad_address, at.key("post_url"),
                  fmt::format("\"post_url\" {} has a query, and the daemon adds its own", quoted(*address)),
                  "Take out the ? or # and what follows.");
    }
  }

  void checkDashboard(const Spot& at, const Dictionary& dashboard) {
    if (const std::string* ip = dashboard.string("ip")) {
      if (const auto fault = faultOfIPv4(*ip))
        _sink.say(fault->name, at.key("ip"), fmt::format("\"ip\" {} {}", quoted(*ip), fault->what),
                  fault->mend);
    }
    _sink.say(reports_without_consent, at,
              "a dashboard gets every message in clear, without consent, sampling or filters");
  }

  const bool _lab;
  LintSink _sink;
};

// Checks the claims that devices with the corresponding settings cannot read.
void checkClaims(const StorebagDocument& bag, LintSink& sink) {
  static constexpr std::pair<const char*, const char*> kMends[] = {
      {"expires", "Write a date like \"2026-12-31\", or with a time: \"2026-12-31T18:00:00Z\"."},
      {"revoked", "Write the 64 hexadecimal digits that keygen and verify print of a key."}};
  const auto claims = config::StorebagClaims::of(bag.storebag);
  for (const auto& [key, mend] : kMends) {
    const auto said = claims.unreadable.find(key);
    const bool hasType = said != claims.unreadable.end() &&
                         config::fits(*bag.storebag.find(key), config::Storebag::kKeys.find(key)->type);
    if (hasType)
      sink.say(wrong_type, Spot::top(bag.document.places).key(key),
               said->second + ": devices that look at it refuse the storebag", mend);
  }
}

void checkSignature(const StorebagDocument& bag, LintSink& sink) {
  if (bag.moreSignatures) return;
  const Spot top = Spot::top(bag.document.places);
  for (const char* key : {"serial", "expires", "revoked"}) {
    if (!bag.storebag.contains(key)) continue;
    sink.say(
        sha1_alone, top.key(key),
        fmt::format("\"{}\" is worth what the signature is worth, and the given scheme rests on SHA-1", key));
    return;
  }
}

}  // namespace

std::vector<Finding> lintStorebag(const StorebagDocument& bag, const LintOptions& options) {
  Lint lint(options);
  lint.checkDictionary(Spot::top(bag.document.places), bag.storebag, config::Storebag::kKeys);
  checkClaims(bag, lint.sink());
  checkSignature(bag, lint.sink());
  std::vector<Finding> findings = lint.take();
  std::stable_sort(findings.begin(), findings.end(), [](const Finding& a, const Finding& b) {
    return std::pair(a.place.line, a.place.column) < std::pair(b.place.line, b.place.column);
  });
  return findings;
}

std::string errorsIn(const StorebagDocument& bag) {
  std::string lines;
  std::size_t count = 0;
  for (const Finding& finding : lintStorebag(bag)) {
    if (kindOf(finding.name).severity != Severity::error) continue;
    lines += "\n" + lineOf(bag.document.file, finding);
    ++count;
  }
  if (count == 0) return "";
  return fmt::format("{}: {} {}{}", bag.document.file, count, count == 1 ? "error" : "errors", lines);
}

Finding findingOf(const DocumentFailure& failure) {
  return {syntax, failure.place.value_or(TextPlace{}), "", failure.detail, failure.mend};
}

}  // namespace veltrad::storebag
