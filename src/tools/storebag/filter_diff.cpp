// SPDX-License-Identifier: Apache-2.0
// Evaluates both filter tables for one event of each kind that they distinguish.
#include "storebag/filter_diff.h"

#include <fmt/format.h>

#include <algorithm>
#include <set>

#include "backends/https/filter_table.h"

namespace veltrad::storebag {
namespace {

using config::FilterAction;
using config::Filters;

// Methods or statuses: those that the filters name, and one for all others.
struct Codes {
  std::set<std::int32_t> named;
  std::int32_t other = 0;

  void complete() {
    while (named.contains(other)) ++other;
  }
  std::vector<std::int32_t> all() const {
    std::vector<std::int32_t> codes(named.begin(), named.end());
    codes.push_back(other);
    return codes;
  }
};

FilterAction actionOn(const Filters& filters, const std::string& field, std::int32_t method,
                      std::int32_t status) {
  backends::FilterTable table;
  table.createFiltersFromArray(filters);
  return table.empty() ? FilterAction::keep : table.actionOn(field, method, status);
}

// Whether a filter says so, rather than none.
bool decides(const Filters& filters, const std::string& field, std::int32_t method, std::int32_t status) {
  const auto rows = filters.ofKey.find(field);
  return rows != filters.ofKey.end() &&
         std::any_of(rows->second.begin(), rows->second.end(), [&](const config::filterTag& row) {
           return (row.method < 0 || row.method == method) && (row.status < 0 || row.status == status);
         });
}

int strictness(FilterAction action) {
  return action == FilterAction::remove ? 2 : action == FilterAction::sha256 ? 1 : 0;
}

const char* phraseOf(FilterAction before, FilterAction now) {
  switch (now) {
    case FilterAction::remove:
      return before == FilterAction::sha256 ? "is removed now, before it was hashed" : "is removed now";
    case FilterAction::sha256:
      return before == FilterAction::remove ? "is hashed now, before it was removed" : "is hashed now";
    case FilterAction::keep:
      break;
  }
  return before == FilterAction::remove ? "is no longer removed" : "is no longer hashed";
}

const char* actionText(FilterAction action) {
  return action == FilterAction::remove ? "remove" : action == FilterAction::sha256 ? "sha256" : "keep";
}

class FieldDiff {
 public:
  FieldDiff(const Filters& before, const Filters& now, std::string field)
      : _old(before), _now(now), _field(std::move(field)) {
    for (const Filters* filters : {&_old, &_now}) {
      const auto rows = filters->ofKey.find(_field);
      if (rows == filters->ofKey.end()) continue;
      _name = *rows->second.front().key;
      for (const config::filterTag& row : rows->second) {
        if (row.method >= 0) _methods.named.insert(row.method);
        if (row.status >= 0) _statuses.named.insert(row.status);
      }
    }
    _methods.complete();
    _statuses.complete();
  }

  std::optional<FieldChange> change() {
    bool everywhere = true, someStricter = false, someLooser = false;
    int worst = 3, methodThere = 0, statusThere = 0;
    for (const std::int32_t method : _methods.all()) {
      for (const std::int32_t status : _statuses.all()) {
        const int more = strictness(actionOn(_now, _field, method, status)) -
                         strictness(actionOn(_old, _field, method, status));
        everywhere = everywhere && more != 0;
        someStricter = someStricter || more > 0;
        someLooser = someLooser || more < 0;
        if (more == 0 || more >= worst) continue;
        worst = more;
        methodThere = method;
        statusThere = status;
      }
    }
    if (!someStricter && !someLooser) return std::nullopt;
    const bool same = everywhere && someStricter != someLooser;
    return changeAt(methodThere, statusThere, same ? "" : eventsOf(methodThere, statusThere));
  }

 private:
  FieldChange changeAt(std::int32_t method, std::int32_t status, std::string events) const {
    const FilterAction before = actionOn(_old, _field, method, status),
                       now = actionOn(_now, _field, method, status);
    const auto shown = [&](const Filters& filters, FilterAction action) {
      return decides(filters, _field, method, status) ? std::optional<Value>(actionText(action))
                                                      : std::nullopt;
    };
    return {_name,
            strictness(now) < strictness(before) ? Effect::more : Effect::less,
            shown(_old, before),
            shown(_now, now),
            phraseOf(before, now),
            std::move(events)};
  }

  std::string eventsOf(std::int32_t method, std::int32_t status) const {
    const auto part = [](const Codes& codes, const char* noun, const char* nouns, std::int32_t code) {
      if (codes.named.empty()) return std::string();
      return codes.named.contains(code) ? fmt::format(" {} {}", noun, code) : fmt::format(" other {}", nouns);
    };
    const std::string methods = part(_methods, "method", "methods", method);
    const std::string statuses = part(_statuses, "status", "statuses", status);
    const char* join = !methods.empty() && !statuses.empty() ? " and" : "";
    return fmt::format(" in events of{}{}{}", methods, join, statuses);
  }

  const Filters& _old;
  const Filters& _now;
  const std::string _field;
  std::string _name;
  Codes _methods;
  Codes _statuses;
};

}  // namespace

std::vector<FieldChange> changedFields(const Filters& before, const Filters& now) {
  std::set<std::string> fields;
  for (const Filters* filters : {&before, &now})
    for (const auto& [field, rows] : filters->ofKey) fields.insert(field);
  std::vector<FieldChange> changes;
  for (const std::string& field : fields)
    if (auto change = FieldDiff(before, now, field).change()) changes.push_back(std::move(*change));
  return changes;
}

}  // namespace veltrad::storebag
