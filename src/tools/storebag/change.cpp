// SPDX-License-Identifier: Apache-2.0
// Names and orders changes.
#include "storebag/change.h"

#include <algorithm>
#include <iterator>

namespace veltrad::storebag {
namespace {

constexpr const char* kKindNames[] = {"consent",  "backend",   "filter",   "entry",      "address",
                                      "country",  "device",    "sampling", "identifier", "order",
                                      "batching", "hierarchy", "refresh",  "version"};
static_assert(std::size(kKindNames) == static_cast<std::size_t>(ChangeKind::version) + 1);

constexpr const char* kEffectNames[] = {"more", "less", "other"};

}  // namespace

const char* nameOf(ChangeKind kind) {
  return kKindNames[static_cast<std::size_t>(kind)];
}

const char* nameOf(Effect effect) {
  return kEffectNames[static_cast<std::size_t>(effect)];
}

std::optional<Value> valueIn(const Dictionary* dictionary, const std::string& key) {
  const Value* value = dictionary ? dictionary->find(key) : nullptr;
  return value ? std::optional(*value) : std::nullopt;
}

Effect worstOf(const std::vector<Change>& changes) {
  Effect worst = Effect::other;
  for (const Change& change : changes) worst = std::min(worst, change.effect);
  return worst;
}

void sortWorstFirst(std::vector<Change>& changes) {
  std::stable_sort(changes.begin(), changes.end(), [](const Change& a, const Change& b) {
    return std::pair(a.effect, a.kind) < std::pair(b.effect, b.kind);
  });
}

}  // namespace veltrad::storebag
