// SPDX-License-Identifier: Apache-2.0
// Remembers the description of a session as last sent, to repeat it on a new connection.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "base/value.h"

namespace veltrad::client {

// The change of the session that a call makes.
struct SessionChange {
  // The part of the description that `described` (the call's arguments) replaces.
  enum class Part {
    nothing,
    // The user info; if there is none, the session loses it, unless it requires some.
    userInfo,
    // Session info and user info.
    sender,
    whole
  };
  Part part = Part::nothing;
  Dictionary described = {};
  bool starts = false;
  bool finishes = false;
};

class SessionDescription {
 public:
  void apply(const SessionChange& change);

  bool described() const { return _description.has_value(); }
  bool started() const { return _started; }
  // No connection is wanted once it has ended.
  bool finished() const { return _finished; }
  // No copies follow, also on later connections.
  void endAggregation();

  // The calls that describe and start the session again, as far as it was described and started. `startID` is
  // the call ID of the second one.
  std::string firstCalls(std::uint32_t startID) const;

 private:
  std::optional<Dictionary> _description;
  bool _started = false;
  bool _finished = false;
};

}  // namespace veltrad::client
