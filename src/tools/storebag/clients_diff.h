// SPDX-License-Identifier: Apache-2.0
// Compares two lists of client entries: which belong together, and who gets another one.
#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "base/value.h"
#include "storebag/change.h"
#include "storebag/clientele.h"
#include "storebag/entry_diff.h"

namespace veltrad::storebag {

class ClientsDiff {
 public:
  // `at` names section and back end. `changes` outlives it.
  ClientsDiff(const Array& before, const Array& now, ChangePlace at, std::vector<Change>& changes);

  void compare();

 private:
  // The number of an entry in each list; nothing: none fits.
  using Move = std::pair<std::optional<std::size_t>, std::optional<std::size_t>>;
  struct Moved {
    Effect effect = Effect::other;
    std::vector<std::string> who;
    // The entries that they had before, or have now; nothing: none.
    std::set<std::optional<std::size_t>> others;
  };

  void pairUp();
  void comparePairs();
  void follow(const std::string& who, const Move& move, Effect effect);
  void followClients();
  void followSessionsWithoutUserInfo();
  void sayAdded();
  void sayRemoved();
  void sayOrder();
  Effect effectOf(const Move& move) const;
  // The other entries, in words: "phone and lamp"; empty: there is none.
  static std::string othersIn(const Moved& moved, const std::vector<WrittenEntry>& entries);
  ChangeSink sinkAt(const WrittenEntry& entry, std::size_t number) const;

  std::vector<WrittenEntry> _old;
  std::vector<WrittenEntry> _now;
  const ChangePlace _at;
  std::vector<Change>& _changes;

  // The partner of each.
  std::vector<std::optional<std::size_t>> _partnerOfOld;
  std::vector<std::optional<std::size_t>> _partnerOfNow;
  // Who gets another entry, by the entry that is new, gone, or now the other one.
  std::map<std::size_t, Moved> _added;
  std::map<std::size_t, Moved> _removed;
  std::map<Move, Moved> _moved;
};

}  // namespace veltrad::storebag
