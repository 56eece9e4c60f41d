// SPDX-License-Identifier: Apache-2.0
// Keeps the arguments of the session's description.
#include "client/session_description.h"

#include "wire/constants.h"
#include "wire/frame.h"
#include "wire/names.h"

namespace veltrad::client {

namespace key = wire::key;
namespace operation = wire::operation;

void SessionDescription::apply(const SessionChange& change) {
  using Part = SessionChange::Part;
  if (change.starts) _started = true;
  if (change.starts || change.finishes) _finished = change.finishes;
  if (change.part == Part::nothing) return;
  if (change.part == Part::whole) {
    _description = change.described;
    return;
  }
  if (change.part == Part::userInfo && !_description) return;
  if (!_description) _description.emplace();
  const Dictionary* info = _description->dictionary(key::kSessionInfo);
  const bool required = info && info->boolean(wire::kVeltraSessionInfoRequireUserInfo).value_or(false);
  if (!change.described.contains(key::kUserInfo) && (change.part == Part::sender || !required))
    _description->erase(key::kUserInfo);
  _description->merge(change.described);
}

void SessionDescription::endAggregation() {
  if (_description) _description->set(key::kHasAggregationBlock, false);
}

std::string SessionDescription::firstCalls(std::uint32_t startID) const {
  std::string frames;
  if (_description) {
    frames =
        wire::makeFrame(wire::FrameKind::call, 0,
                        {{key::kArguments, *_description}, {key::kOperation, operation::kSetSessionInfo}});
  }
  if (_started) {
    frames += wire::makeFrame(wire::FrameKind::call, startID,
                              {{key::kArguments, Dictionary{}}, {key::kOperation, operation::kStartConfig}});
  }
  return frames;
}

}  // namespace veltrad::client
