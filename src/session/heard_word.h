// SPDX-License-Identifier: Apache-2.0
// What a session has heard of the owner's word. The session's thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>

#include "backends/session_facts.h"
#include "config/owner_gate.h"

namespace veltrad::session {

class HeardWord {
 public:
  // The gate outlives it.
  explicit HeardWord(const config::OwnerGate& gate) : _gate(gate) {}

  // True if there is another word than before, which is heard now.
  bool hear();
  const config::OwnersWord& now() const { return *_word; }
  // Without what the owner keeps back. Null stays null, and what holds nothing of that kind the same object.
  backends::SharedDictionary allowed(const backends::SharedDictionary& userInfo) const;
  // The payload itself, or, if it holds something that the owner keeps back, one without that in `changed`.
  const Dictionary* allowed(const Dictionary* payload, std::optional<Dictionary>& changed) const;
  void restrict(Array& logData) const;

 private:
  const config::OwnerGate& _gate;
  std::uint64_t _heard = 0;
  std::shared_ptr<const config::OwnersWord> _word = std::make_shared<const config::OwnersWord>();
};

}  // namespace veltrad::session
