// SPDX-License-Identifier: Apache-2.0
// Compares client entries with one another, and filters with one another.
#pragma once

#include <cstddef>
#include <vector>

#include "base/value.h"
#include "storebag/lint_sink.h"

namespace veltrad::storebag {

class EntryCheck {
 public:
  // The sink outlives it.
  explicit EntryCheck(LintSink& sink) : _sink(sink) {}

  // `at` is the key's of the array. Elements that are no dictionaries are passed over.
  void checkEntries(const Spot& at, const Array& entries) const;
  void checkFilters(const Spot& at, const Array& filters) const;
  void checkConsent(const Spot& at, const Dictionary& entry) const;

 private:
  struct Filter;
  void checkAction(const Spot& at, const Dictionary& filter) const;
  // That at `place` among all.
  void checkFilter(const Spot& at, const std::vector<Filter>& filters, std::size_t place) const;

  LintSink& _sink;
};

}  // namespace veltrad::storebag
