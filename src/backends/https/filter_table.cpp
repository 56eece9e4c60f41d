// The filter table built and applied.
#include "backends/https/filter_table.h"

#include <optional>

#include "backends/backend.h"
#include "base/text.h"
#include "formats/json.h"

namespace veltrad::backends {

namespace {
constexpr std::int32_t kKeep = 0;
constexpr std::int32_t kRemove = 1;
constexpr std::int32_t kHash = 2;

std::int32_t actionNamed(const std::string* name) {
  if (!name) return kKeep;
  if (*name == "remove") return kRemove;
  return *name == "sha256" ? kHash : kKeep;
}

// A text's digest; that of the JSON text for a number or boolean; nothing for what has no text, which must
// then be removed: a field that was to be hashed never leaves in clear.
std::optional<std::string> digestOf(const Value& value) {
  if (const std::string* text = value.asString()) return VeltraBackend::convertIntoSHA256(*text);
  if (value.isNumber() || value.isBoolean())
    return VeltraBackend::convertIntoSHA256(formats::writeJSON(value));
  return std::nullopt;
}
}  // namespace

void FilterTable::createFiltersFromArray(const Array& filters) {
  if (filters.empty()) return;
  _filters.clear();
  _recordsOfKey.clear();
  for (const Value& element : filters) {
    filterTag record;
    if (const Dictionary* filter = element.asDictionary()) {
      record.method = filter->int32("method").value_or(-1);
      record.status = filter->int32("status").value_or(-1);
      record.action = actionNamed(filter->string("action"));
      if (const std::string* key = filter->string("key")) {
        record.key = *key;
        _recordsOfKey[lowerCase(*key)].push_back(_filters.size());
      }
    }
    _filters.push_back(std::move(record));
  }
}

const filterTag* FilterTable::match(const std::string& key, std::int32_t method, std::int32_t status) const {
  const auto records = _recordsOfKey.find(lowerCase(key));
  if (records == _recordsOfKey.end()) return nullptr;
  for (const std::size_t index : records->second) {
    const filterTag& record = _filters[index];
    const bool methodFits = record.method < 0 || record.method == method;
    const bool statusFits = record.status < 0 || record.status == status;
    if (methodFits && statusFits) return &record;
  }
  return nullptr;
}

FilterTable::Outcome FilterTable::filterEvent(Dictionary& event) const {
  Outcome outcome;
  if (_recordsOfKey.empty()) return outcome;
  const std::int32_t method = event.int32("_method").value_or(0);
  const std::int32_t status = event.int32("_status").value_or(0);
  std::vector<Dictionary::Entry> kept;
  kept.reserve(event.size());
  for (const auto& [key, value] : event) {
    const filterTag* record = match(key, method, status);
    const std::int32_t action = record ? record->action : kKeep;
    if (action == kKeep) {
      kept.emplace_back(key, value);
      continue;
    }
    const auto digest = action == kHash ? digestOf(value) : std::nullopt;
    if (digest) {
      kept.emplace_back(key, *digest);
      ++outcome.hashed;
    } else {
      ++outcome.removed;
    }
  }
  if (outcome.hashed + outcome.removed > 0) event = Dictionary::fromEntries(std::move(kept));
  return outcome;
}

}  // namespace veltrad::backends
