// SPDX-License-Identifier: Apache-2.0
// Writes the history and the record of fates for posts in the spool. Any thread.
#pragma once

#include <optional>
#include <string>

#include "http/request_gate.h"
#include "wire/fate_entries.h"

namespace veltrad::config {
class OwnerGate;
}  // namespace veltrad::config

namespace veltrad::platform {
class FateRing;
}  // namespace veltrad::platform

namespace veltrad::support {
struct SpoolEntry;
struct SpoolPlace;
}  // namespace veltrad::support

namespace veltrad::backends {

class SpoolRecorder {
 public:
  // Both must outlive it; `fates` may be null.
  SpoolRecorder(config::OwnerGate& gate, platform::FateRing* fates) : _gate(gate), _fates(fates) {}

  bool keepsRecords() const;
  // Records a post that has ended for good after so many transmissions, as one record.
  void record(const support::SpoolEntry& post, int transmissions, http::DepartureEnd end) const;

  // One that the record of fates does not know is passed over.
  void dropped(const support::SpoolPlace& post, wire::Reason reason) const {
    note(wire::Step::dropped, post, reason, {});
  }
  void again(const support::SpoolPlace& post) const { note(wire::Step::again, post, std::nullopt, {}); }
  void answered(const support::SpoolPlace& post, wire::Reason reason, int status) const;
  // `wait`: in seconds, until its address is tried again.
  void kept(const support::SpoolPlace& post, const std::string& error, double wait) const;

 private:
  void note(wire::Step step, const support::SpoolPlace& post, std::optional<wire::Reason> reason,
            wire::StepEntry entry) const;

  config::OwnerGate& _gate;
  platform::FateRing* const _fates;
};

}  // namespace veltrad::backends
