// SPDX-License-Identifier: Apache-2.0
// The results of a message in a back end, and the steps to them: one table of names for the daemon and its
// tools.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

#include "wire/constants.h"
#include "wire/reasons.h"

namespace veltrad::wire {

// none: the back end takes no such message. held: in a batch until the back end's state is decided. posted:
// the post has begun. waiting: a datagram waits for its acknowledgement, or for room in the socket. sent: a
// datagram that nobody acknowledges. written: to the energy log. delivered: to the adaptor. lost: a post
// without an answer, which may have arrived. given_up: a datagram that was never acknowledged. kept: a post
// in the spool, to be sent again.
enum class Fate : std::uint8_t {
  none,
  dropped,
  held,
  batched,
  posted,
  waiting,
  sent,
  written,
  delivered,
  lost,
  acknowledged,
  given_up,
  kept
};

inline constexpr std::string_view kFateNames[] = {
    "none",    "dropped",   "held", "batched",      "posted",   "waiting", "sent",
    "written", "delivered", "lost", "acknowledged", "given_up", "kept"};
static_assert(std::size(kFateNames) == static_cast<std::size_t>(Fate::kept) + 1);

constexpr std::string_view nameOf(Fate fate) {
  return kFateNames[static_cast<std::size_t>(fate)];
}

// A processing step of a message, in order. held: in a batch as above, or a datagram that the socket did not
// take. The last two are no steps: `none` is the fate of that name, and `restored` says that a flush has
// restored the original values of fields that were changed before.
enum class Step : std::uint8_t {
  taken,
  aggregated,
  removed,
  hashed,
  batched,
  held,
  flushed,
  posted,
  answered,
  kept,
  sent,
  again,
  acknowledged,
  given_up,
  written,
  delivered,
  dropped,
  lost,
  none,
  restored
};

inline constexpr std::string_view kStepNames[] = {
    "taken",   "aggregated", "removed", "hashed", "batched", "held",         "flushed",
    "posted",  "answered",   "kept",    "sent",   "again",   "acknowledged", "given_up",
    "written", "delivered",  "dropped", "lost",   "none",    "restored"};
static_assert(std::size(kStepNames) == static_cast<std::size_t>(Step::restored) + 1);

constexpr std::string_view nameOf(Step step) {
  return kStepNames[static_cast<std::size_t>(step)];
}

// The back ends by number, from 1; 0 means all back ends of a session.
inline constexpr std::string_view kBackendNames[] = {"",
                                                     kVeltraBackendAmpery,
                                                     kVeltraBackendDashboard,
                                                     kVeltraBackendHTTPPost,
                                                     kVeltraBackendHTTPPost2,
                                                     kVeltraBackendMivo,
                                                     kVeltraBackendUploadServer};

// 0 for an unknown name.
constexpr std::uint8_t numberOfBackend(std::string_view name) {
  const auto* const found = std::find(std::begin(kBackendNames), std::end(kBackendNames), name);
  return found == std::end(kBackendNames) ? std::uint8_t{0}
                                          : static_cast<std::uint8_t>(found - std::begin(kBackendNames));
}

// A back end's decision on a message and the reason: why the message was not sent, else the reason for the
// back end's state.
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
