// SPDX-License-Identifier: Apache-2.0
// Takes fields out as the owner's word asks. The session's thread.
#include "session/heard_word.h"

namespace veltrad::session {

bool HeardWord::hear() {
  const std::uint64_t turn = _gate.turn();
  if (turn == _heard) return false;
  _heard = turn;
  _word = _gate.word();
  return true;
}

backends::SharedDictionary HeardWord::allowed(const backends::SharedDictionary& userInfo) const {
  std::optional<Dictionary> changed;
  const Dictionary* sent = allowed(userInfo.get(), changed);
  return sent == userInfo.get() ? userInfo : std::make_shared<const Dictionary>(std::move(*changed));
}

const Dictionary* HeardWord::allowed(const Dictionary* payload, std::optional<Dictionary>& changed) const {
  if (!payload || !_word->fields) return payload;
  config::EditedFields changes;
  return _word->fields->apply(changed.emplace(*payload), changes) ? &*changed : payload;
}

void HeardWord::restrict(Array& logData) const {
  if (!_word->fields) return;
  config::EditedFields changes;
  for (Value& element : logData) _word->fields->apply(element, changes);
}

}  // namespace veltrad::session
