// SPDX-License-Identifier: Apache-2.0
// Removes fields as the owner's policy requires. The session's thread.
#include "session/owner_filter.h"

#include <utility>

namespace veltrad::session {

void OwnerFilter::hear(const std::function<void()>& obey) {
  for (std::uint64_t turn = _gate.turn(); turn != _heard; turn = _gate.turn()) {
    auto before = std::exchange(_decision, _gate.decision());
    _reset = _decision->resets != before->resets;
    try {
      obey();
    } catch (...) {
      _decision = std::move(before);
      throw;
    }
    _heard = turn;
  }
}

void OwnerFilter::takeIdentity(support::DeviceIdentity& device, char (&deviceID)[41],
                               const BackendSet* set) const {
  if (_reset) device.copyUniqueDeviceID(deviceID, sizeof deviceID);
  const bool always = _decision->policy->rules().consent == config::ConsentRule::always;
  for (const auto& [name, backend] : set ? *set : BackendSet()) {
    if (_reset) backend->takeIdentity(deviceID);
    if (always) backend->rereadConsent();
  }
}

backends::UserInfo OwnerFilter::allowed(const backends::SharedDictionary& userInfo) const {
  backends::UserInfo info{userInfo, userInfo, nullptr};
  if (!userInfo || !_decision->fields) return info;
  Dictionary sent = *userInfo;
  auto edits = std::make_shared<config::EditedFields>();
  if (!_decision->fields->apply(sent, *edits)) return info;
  info.sent = std::make_shared<const Dictionary>(std::move(sent));
  info.edits = std::move(edits);
  return info;
}

config::EditedFields OwnerFilter::restrict(std::optional<Dictionary>& payload) const {
  config::EditedFields edits;
  if (payload && _decision->fields) _decision->fields->apply(*payload, edits);
  return edits;
}

config::EditedFields OwnerFilter::restrict(Array& logData) const {
  config::EditedFields edits;
  if (!_decision->fields) return edits;
  for (Value& element : logData) _decision->fields->apply(element, edits);
  return edits;
}

}  // namespace veltrad::session
