// SPDX-License-Identifier: Apache-2.0
// What the history of what left and the record of fates are told of posts in the spool. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "http/request_gate.h"
#include "wire/fates.h"

namespace veltrad::config {
class OwnerGate;
}  // namespace veltrad::config

namespace veltrad::platform {
class FateRing;
}  // namespace veltrad::platform

namespace veltrad::support {
struct SpoolEntry;
}  // namespace veltrad::support

namespace veltrad::backends {

// A post in the record of fates. Number 0: it is not there.
struct NotedPost {
  std::uint8_t backend = 0;
  std::uint64_t number = 0;
};

class SpoolNotes {
 public:
  // Both outlive it; `fates` may be null.
  SpoolNotes(config::OwnerGate& gate, platform::FateRing* fates) : _gate(gate), _fates(fates) {}

  bool keepsRecords() const;
  // A post that was sent so often has ended, for good. One record for all of it.
  void record(const support::SpoolEntry& post, int transmissions, http::DepartureEnd end) const;

  void dropped(const NotedPost& post, wire::Reason reason) const {
    note(wire::Step::dropped, post, reason, 0);
  }
  void again(const NotedPost& post) const { note(wire::Step::again, post, std::nullopt, 0); }
  void answered(const NotedPost& post, wire::Reason reason, int status) const {
    note(wire::Step::answered, post, reason, status);
  }
  // `wait`: in seconds, until its address is tried again.
  void kept(const NotedPost& post, const std::string& error, double wait) const;

 private:
  void note(wire::Step step, const NotedPost& post, std::optional<wire::Reason> reason, int status) const;

  config::OwnerGate& _gate;
  platform::FateRing* const _fates;
};

}  // namespace veltrad::backends
