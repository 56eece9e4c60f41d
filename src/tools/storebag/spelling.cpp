// SPDX-License-Identifier: Apache-2.0
// Counts the letters by which names differ.
#include "storebag/spelling.h"

#include <fmt/format.h>

#include <algorithm>
#include <numeric>
#include <utility>

#include "base/text.h"
#include "storebag/lint_sink.h"
#include "storebag/words.h"

namespace veltrad::storebag {
namespace {

// A name of many thousand letters resembles none, and comparing it would take long.
constexpr std::size_t kMostLetters = 64;

std::size_t differences(std::string_view a, std::string_view b) {
  std::vector<std::size_t> twoAbove, above(b.size() + 1), row(b.size() + 1);
  std::iota(above.begin(), above.end(), std::size_t{0});
  for (std::size_t i = 1; i <= a.size(); ++i) {
    row[0] = i;
    for (std::size_t j = 1; j <= b.size(); ++j) {
      const std::size_t exchanged = a[i - 1] == b[j - 1] ? 0 : 1;
      row[j] = std::min({above[j] + 1, row[j - 1] + 1, above[j - 1] + exchanged});
      if (i > 1 && j > 1 && a[i - 1] == b[j - 2] && a[i - 2] == b[j - 1])
        row[j] = std::min(row[j], twoAbove[j - 2] + 1);
    }
    twoAbove = std::exchange(above, row);
  }
  return above[b.size()];
}

}  // namespace

std::optional<std::string> closestName(std::string_view given, const std::vector<std::string>& known) {
  constexpr std::size_t kFewestContained = 3;
  if (given.empty() || given.size() > kMostLetters) return std::nullopt;
  const std::string name = lowerCase(given);
  const std::string* closest = nullptr;
  std::size_t fewest = std::max<std::size_t>(1, name.size() / 3) + 1;
  for (const std::string& candidate : known) {
    const std::size_t count = differences(name, lowerCase(candidate));
    if (count >= fewest) continue;
    fewest = count;
    closest = &candidate;
  }
  if (closest) return *closest;
  for (const std::string& candidate : known) {
    const std::string other = lowerCase(candidate);
    const auto& [part, whole] =
        std::minmax(name, other, [](const auto& a, const auto& b) { return a.size() < b.size(); });
    if (part.size() >= kFewestContained && whole.find(part) != std::string::npos) return candidate;
  }
  return std::nullopt;
}

std::string mostLike(std::string_view given, const std::vector<std::string>& known) {
  const auto meant = closestName(given, known);
  return meant ? fmt::format(": did you mean {}?", quoted(*meant))
               : fmt::format(": expected one of {}", listed(known));
}

}  // namespace veltrad::storebag
