// SPDX-License-Identifier: Apache-2.0
// What a session has heard of the owner's word. The session's thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>

#include "backends/session_facts.h"
#include "config/owner_gate.h"
#include "session/backend_set.h"

namespace veltrad::session {

class HeardWord {
 public:
  // The gate outlives it.
  explicit HeardWord(const config::OwnerGate& gate) : _gate(gate) {}

  // Hears the word while there is another one than before, and has it obeyed. What `obey` throws leaves the
  // word unheard, so that it is heard at the next call.
  void hear(const std::function<void()>& obey);
  const config::OwnersWord& now() const { return *_word; }
  // If the word that was heard last came with other identifiers than the one before, reads the device's anew
  // and has the back ends read theirs. These read consent again if the policy asks for it at any time. `set`
  // may be null.
  void takeIdentity(support::DeviceIdentity& device, char (&deviceID)[41], const BackendSet* set) const;
  // With what of it may leave: null stays null, and what holds nothing that the owner keeps back the same
  // object.
  backends::UserInfo allowed(const backends::SharedDictionary& userInfo) const;
  // Take out what the owner keeps back, and say what that was.
  config::EditedFields restrict(std::optional<Dictionary>& payload) const;
  config::EditedFields restrict(Array& logData) const;

 private:
  const config::OwnerGate& _gate;
  std::uint64_t _heard = 0;
  bool _reset = false;
  std::shared_ptr<const config::OwnersWord> _word = std::make_shared<const config::OwnersWord>();
};

}  // namespace veltrad::session
