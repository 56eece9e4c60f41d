// SPDX-License-Identifier: Apache-2.0
// Compares two states of a storebag.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/value.h"
#include "storebag/change.h"
#include "storebag/recording.h"

namespace veltrad::storebag {

// The worst for users first.
std::vector<Change> changesOf(const Dictionary& before, const Dictionary& now);

// A recorded message that has another fate.
struct ChangedMessage {
  // In the file, from 1.
  std::size_t line = 0;
  // "httppost: posted to https://c.example/e, without peer"
  std::string was;
  std::string is;
};
struct MessageChanges {
  std::size_t total = 0;
  // In the order of their lines.
  std::vector<ChangedMessage> changed;
};

// Plays them with both. `given` is what the lines do not say.
MessageChanges messageChangesOf(const Dictionary& before, const Dictionary& now, const Given& given,
                                const std::vector<RecordedMessage>& messages);

struct StorebagDiff {
  std::vector<Change> changes;
  // Absent: no messages are given.
  std::optional<MessageChanges> messages;

  bool letsMoreLeave() const { return worstOf(changes) == Effect::more; }
};

Dictionary asDictionary(const StorebagDiff& diff);
// For people.
std::string textOf(const StorebagDiff& diff);

}  // namespace veltrad::storebag
