// SPDX-License-Identifier: Apache-2.0
// What became of a message in a back end: one table of names for the daemon and its tools.
#pragma once

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

#include "wire/reasons.h"

namespace veltrad::wire {

// none: the back end takes no such message. held: in a batch until the back end's state is decided. posted:
// the post has begun. waiting: a datagram waits for its acknowledgement, or for room in the socket. sent: a
// datagram that nobody acknowledges. written: to the energy log. delivered: to the adaptor.
enum class Fate : std::uint8_t { none, dropped, held, batched, posted, waiting, sent, written, delivered };

inline constexpr std::string_view kFateNames[] = {"none",    "dropped", "held",    "batched",  "posted",
                                                  "waiting", "sent",    "written", "delivered"};
static_assert(std::size(kFateNames) == static_cast<std::size_t>(Fate::delivered) + 1);

constexpr std::string_view nameOf(Fate fate) {
  return kFateNames[static_cast<std::size_t>(fate)];
}

// What a back end has decided for a message, and why: what kept the message back, else the reason of the back
// end's state.
struct Decision {
  Fate fate = Fate::none;
  Reason reason = Reason::takes_no_messages;

  bool operator==(const Decision&) const = default;
};

struct Outcome {
  std::string backend;
  Decision decision;

  bool operator==(const Outcome&) const = default;
};
using Outcomes = std::vector<Outcome>;

}  // namespace veltrad::wire
