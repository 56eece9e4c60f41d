// SPDX-License-Identifier: Apache-2.0
// Writes a session's messages, files and log data into the record of fates as they are taken in. The
// session's thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "backends/backend.h"
#include "config/storebag_content.h"
#include "platform/fate_writer.h"
#include "session/backend_set.h"

namespace veltrad::session {

struct FamilyFacts;
struct Message;

class SessionFates {
 public:
  using From = wire::MessageEntry::From;
  using Item = wire::MessageEntry::Item;

  // Null: nothing is recorded. The ring must outlive it.
  explicit SessionFates(platform::FateRing* ring) : _pen(ring, {}) {}

  // Sets the origin and session info of the back ends that are made next; later session info does not change
  // them. Returns the list to fill with those that were not made.
  NotMade* comesFrom(const config::StorebagOrigin& origin, backends::SharedDictionary sessionInfo);
  // To be called when the facts of the session have changed.
  void forget() { _session = 0; }
  // True if the record has the session's entry; if not, call describe() first.
  bool described() const { return !_pen.writes() || _pen.ring()->fresh(_session); }
  // `from` says whether the facts are those of a message without a session of its own.
  void describe(const FamilyFacts& facts, From from);

  // Sets the message's note; `edits` is what the owner withholds of its payload, which the payload no longer
  // holds. Without `edits` it reached no back end, for `reason`. The time of a message that has none is now.
  // `copyTo`: the session whose client got a copy; empty: none.
  void taken(Message& message, From from, const config::EditedFields* edits,
             std::optional<wire::Reason> reason = std::nullopt, const std::string& copyTo = {});
  // Records a message that reached no back end.
  void refused(const FamilyFacts& facts, Message message, From from, wire::Reason why);
  // Records a file or log data.
  backends::MessageNote taken(Item item);

 private:
  const platform::FateWriter _pen;
  // Position of the session's entry; 0 if there is none.
  std::uint64_t _session = 0;
  config::StorebagOrigin _origin;
  backends::SharedDictionary _sessionInfo;  // null before there are back ends
  backends::SharedDictionary _sentUserInfo;
  NotMade _notMade;
};

}  // namespace veltrad::session
