// SPDX-License-Identifier: Apache-2.0
// Collects findings, and how values are shown in them.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "formats/json.h"
#include "storebag/findings.h"
#include "storebag/spot.h"

namespace veltrad::storebag {

class LintSink {
 public:
  // Without a mend it is the one of the table.
  void say(FindingName name, const Spot& at, std::string message, std::string mend = {}) {
    if (mend.empty()) mend = kindOf(name).mend;
    _findings.push_back({name, at.place, at.path, std::move(message), std::move(mend)});
  }
  std::vector<Finding> take() { return std::move(_findings); }

 private:
  std::vector<Finding> _findings;
};

inline std::string quoted(const std::string& text) {
  return formats::writeJSON(Value(text));
}
inline std::string shownValue(const Value& value) {
  constexpr std::size_t kMostShown = 80;
  const formats::JSONExcerpt excerpt = formats::excerptOfJSON(value, kMostShown);
  return excerpt.leftOut == 0 ? excerpt.text : excerpt.text + "…";
}

}  // namespace veltrad::storebag
