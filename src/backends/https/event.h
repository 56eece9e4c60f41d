// SPDX-License-Identifier: Apache-2.0
// Makes the event, a flat JSON object, of a message.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>

#include "backends/backend.h"
#include "backends/https/filter_table.h"

namespace veltrad::backends {

// Empty for a client type that has none.
std::string senderCode(std::int32_t compType);

// Events are kept as the texts that are posted, which take less memory than their values and are written
// once.
struct EventText {
  std::string json;
  std::size_t fields = 0;

  bool operator==(const EventText&) const = default;
};

// The text of an event that JSON can represent.
EventText eventText(const Dictionary& event);
// Changes the fields of an event. Reading its text back costs more than writing it, but few events change.
void changeEvent(EventText& event, const std::function<void(Dictionary&)>& change);

struct WrittenEvent {
  EventText text;
  // "_method", which user info and filters may have changed; 0 if it is missing or no number.
  std::int32_t method = 0;
  FilterTable::Outcome filtered;
  config::EditedFields edits;
  // Fields that were removed because JSON cannot represent them.
  std::size_t notJSON = 0;
  // True if merging the same user info again, filtered separately, would change nothing.
  bool settled = true;
};

// The message's payload with these fields: "_startTS" (the session's start, cut to the minute), "_sender",
// "_clientVersion", "_sessionID", "_eventNumber", "_method", "_status", "_clientTS" and "eventTime" (exact
// offset from the cut start), "_productFamily", "_productModel", "_osVersion", "_build", "_internal",
// "_reportVers", "_timezoneOffset" (seconds from GMT). A field whose text is absent is left out. Then the
// user info that may leave is merged, which replaces fields of both; then the filters are applied.
// `expectedBytes` may be any number: if it is the length of the text, the buffer is allocated only once.
WrittenEvent writeEvent(const SessionFacts& facts, const std::string& productFamily,
                        const NumberedMessage& message, int timeZoneOffset, const FilterTable& filters,
                        std::size_t expectedBytes);

}  // namespace veltrad::backends
