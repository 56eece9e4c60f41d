// SPDX-License-Identifier: Apache-2.0
// Counts what was written, and keeps what it says about the session.
#include "client/sent_record.h"

#include "wire/frame.h"

namespace veltrad::client {

void SentRecord::written(const OutCall& call) {
  ++_sent;
  _calls.add(wire::decodeFrameHeader(call.bytes.data()).callID, call.counted);
  if (call.change) _standing.apply(*call.change);
}

void SentRecord::cut(const OutCall& call) {
  dropped(call);
  if (call.change) _standing.apply(*call.change);
}

void SentRecord::connectionEnded() {
  _lost += _calls.uncertain();
  _calls.clear();
}

std::uint64_t SentRecord::tellLost() {
  _told = _lost;
  return _lost;
}

}  // namespace veltrad::client
