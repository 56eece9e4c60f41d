// SPDX-License-Identifier: Apache-2.0
// Applies filters to events.
#include "backends/https/filter_table.h"

#include <vector>

#include "backends/backend.h"
#include "base/text.h"
#include "formats/json.h"

namespace veltrad::backends {

using config::FilterAction;

std::optional<std::string> FilterTable::digestOf(const Value& value) {
  if (const std::string* text = value.asString()) return VeltraBackend::convertIntoSHA256(*text);
  if (value.isNumber() || value.isBoolean())
    return VeltraBackend::convertIntoSHA256(formats::writeJSON(value));
  return std::nullopt;
}

FilterAction FilterTable::actionOn(std::string_view key, std::int32_t method, std::int32_t status) const {
  const auto records = _filters->ofKey.find(lowerCase(key));
  if (records == _filters->ofKey.end()) return FilterAction::keep;
  for (const config::filterTag& record : records->second) {
    const bool methodFits = record.method < 0 || record.method == method;
    const bool statusFits = record.status < 0 || record.status == status;
    if (methodFits && statusFits) return record.action;
  }
  return FilterAction::keep;
}

bool FilterTable::concerns(const std::string& name) const {
  return _filters && !_filters->ofKey.empty() && _filters->ofKey.contains(lowerCase(name));
}

FilterTable::Outcome FilterTable::filterEvent(Dictionary& event, config::FieldChanges& changes) const {
  Outcome outcome;
  if (empty()) return outcome;
  const std::int32_t method = event.int32("_method").value_or(0);
  const std::int32_t status = event.int32("_status").value_or(0);
  std::vector<Dictionary::Entry> kept;
  kept.reserve(event.size());
  for (const auto& [key, value] : event) {
    const FilterAction action = actionOn(key, method, status);
    if (action == FilterAction::keep) {
      kept.emplace_back(key, value);
      continue;
    }
    const auto digest = action == FilterAction::sha256 ? digestOf(value) : std::nullopt;
    if (digest) {
      kept.emplace_back(key, *digest);
      ++outcome.hashed;
    } else {
      ++outcome.removed;
    }
    changes.changed(digest ? config::FieldChange::hashed : config::FieldChange::removed, key);
  }
  if (outcome.hashed + outcome.removed > 0) event = Dictionary::fromEntries(std::move(kept));
  return outcome;
}

}  // namespace veltrad::backends
