// SPDX-License-Identifier: Apache-2.0
// The entries of the record of fates, as they lie in the daemon's ring and are passed to veltractl.
#pragma once

#include <array>
#include <bit>
#include <cstdint>
#include <optional>

#include "wire/fates.h"

namespace veltrad::wire {

// Version of the layout; it changes with any entry, and reader and writer must agree.
inline constexpr std::uint32_t kFateLayout = 2;
inline constexpr std::size_t kFateWords = 7;
using FateWords = std::array<std::uint64_t, kFateWords>;

// Where an entry refers to an earlier one: the low half of its position. 0: none.
using FateRef = std::uint32_t;

// Times are microseconds since 1970. 0 stands for no message, batch or post.
enum class EntryKind : std::uint8_t { none, text, moreText, session, message, standing, step, names };

// The numbers of files and log data have this bit, those of messages have not.
inline constexpr std::uint64_t kNoMessage = std::uint64_t{1} << 63;

inline constexpr std::uint8_t kNoReason = 255;
static_assert(kReasonCount < kNoReason);
// The reason in an entry's `reason`.
constexpr std::optional<Reason> reasonIn(std::uint8_t number) {
  return number == kNoReason ? std::nullopt : std::optional(static_cast<Reason>(number));
}

// A text; the rest that does not fit is in the following entries.
struct TextEntry {
  EntryKind kind = EntryKind::text;
  std::uint8_t unused = 0;
  std::uint16_t length = 0;  // of the whole text
  std::uint32_t hash = 0;
  char bytes[48] = {};
};
struct MoreTextEntry {
  EntryKind kind = EntryKind::moreText;
  char bytes[55] = {};
};

// The facts of a message's session. It has room for three back ends that were not made.
// Its 14 fields are its layout in the record.
struct SessionEntry {
  static constexpr std::size_t kNotMade = 3;
  enum Known : std::uint8_t { clientTypeKnown = 1, sessionIDKnown = 2, clientVersionKnown = 4 };

  EntryKind kind = EntryKind::session;
  std::uint8_t known = 0;
  std::uint16_t clientVersion = 0;
  std::int32_t clientType = 0;
  std::uint32_t sessionID = 0;
  FateRef session = 0;
  FateRef client = 0;
  FateRef service = 0;
  FateRef storebag = 0;
  FateRef version = 0;
  FateRef section = 0;
  FateRef notMade[kNotMade] = {};
  std::uint8_t notMadeReasons[kNotMade] = {kNoReason, kNoReason, kNoReason};
  std::uint8_t unused[5] = {};
};

// A message, a file or log data that was taken in.
// Its 14 fields are its layout in the record.
struct MessageEntry {
  enum class From : std::uint8_t { client, session, oneShot };
  enum class Item : std::uint8_t { message, file, logData };
  enum Known : std::uint8_t { categoryKnown = 1, typeKnown = 2 };

  EntryKind kind = EntryKind::message;
  From from = From::client;
  Item item = Item::message;
  std::uint8_t known = categoryKnown | typeKnown;
  FateRef session = 0;
  std::uint64_t message = 0;
  std::int64_t time = 0;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::int32_t flag = 0;
  std::uint8_t reason = kNoReason;  // why it reached no back end
  std::uint8_t unused[3] = {};
  FateRef aggregatedTo = 0;  // the session whose client got a copy
  std::uint8_t more[16] = {};
};

// The state of a back end, and the reason.
struct StandingEntry {
  enum Differs : std::uint8_t { clientDiffers = 1, serviceDiffers = 2 };

  EntryKind kind = EntryKind::standing;
  std::uint8_t backend = 0;
  std::uint8_t state = 0;
  std::uint8_t reason = kNoReason;
  std::uint8_t differs = 0;  // what the nearest client entry does not fit
  std::uint8_t unused[3] = {};
  std::int32_t entry = -1;    // of the storebag's section, from 0; -1: none
  std::int32_t nearest = -1;  // if none fits
  double draw = 0;            // not finite: none
  double threshold = 0;
  std::uint64_t more[3] = {};
};

// A step of a message, of a batch or of a post. Of one that is kept, `text` is what went wrong, and `bytes`
// are the seconds until its address is tried again.
// Its 14 fields are its layout in the record.
struct StepEntry {
  EntryKind kind = EntryKind::step;
  Step step = Step::none;
  std::uint8_t backend = 0;
  std::uint8_t reason = kNoReason;
  FateRef text = 0;  // the address of a post or datagram, the session that got a copy
  std::int64_t time = 0;
  std::uint64_t message = 0;
  std::uint64_t batch = 0;
  std::uint64_t post = 0;
  std::uint32_t bytes = 0;
  std::uint32_t events = 0;
  std::uint16_t status = 0;
  std::uint16_t eventNumber = 0;
  FateRef standing = 0;
};

// Names of fields that were removed, hashed or restored: of a message, or of all in a batch.
struct NamesEntry {
  static constexpr std::size_t kMost = 6;

  EntryKind kind = EntryKind::names;
  Step step = Step::none;
  std::uint8_t backend = 0;
  std::uint8_t count = 0;
  std::uint32_t unused = 0;
  std::int64_t time = 0;
  std::uint64_t message = 0;
  std::uint64_t batch = 0;
  FateRef names[kMost] = {};
};

template <typename Entry>
FateWords wordsOf(const Entry& entry) {
  static_assert(sizeof(Entry) == sizeof(FateWords));
  return std::bit_cast<FateWords>(entry);
}
template <typename Entry>
Entry entryOf(const FateWords& words) {
  static_assert(sizeof(Entry) == sizeof(FateWords));
  return std::bit_cast<Entry>(words);
}
inline EntryKind kindOf(const FateWords& words) {
  return entryOf<TextEntry>(words).kind;
}

}  // namespace veltrad::wire
