// SPDX-License-Identifier: Apache-2.0
// The answers to calls and the copies of messages, and the lines that veltractl prints for them.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/value.h"
#include "tools/ctl/operation.h"
#include "veltra/veltra.h"
#include "wire/error.h"

namespace veltrad::ctl {

struct Answer {
  // Unless it is VELTRA_OK, the call ended without an answer, and `error` says why.
  veltra_status status = VELTRA_OK;
  std::optional<std::string> reply;
  std::optional<Array> backends;  // names
  std::optional<Array> outcomes;  // as veltra_reply_outcomes()
  std::optional<wire::ReportingError> error;
  bool uploaded = false;
  // The uploaded file was removed.
  bool removed = false;
};

// A copy of a message, for a session that aggregates. All fields are empty once aggregation has ended.
// `timestamp` is in seconds since 1970.
struct AggregatedCopy {
  std::optional<Dictionary> sessionInfo;
  double timestamp = 0;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;
};

// The answer for a call that was not sent.
Answer answerOfFailure(veltra_status status);

// JSON without a line break, "op" first. Answers to a flush and to uploaded log data always have "error";
// others have it only if the call ended without an answer.
std::string formatAnswer(Operation operation, const Answer& answer);
// The same for one message, with "outcomes".
std::string formatSent(const Answer& answer);
// For people: "httppost: dropped: no consent to diagnostic submission (no_consent)", one for each back end.
std::vector<std::string> outcomeLines(const Answer& answer);
// Whether a back end reports the message, or will.
bool reported(const Answer& answer);
// {"op":"aggregated","sessionInfo":…,"timestamp":…,"category":…,"type":…,"payload":…}; null where absent.
std::string formatAggregated(const AggregatedCopy& copy);
// {"op":"error","line":N,"description":"…"}; N starts at 1.
std::string formatMalformedLine(std::uint64_t line, std::string_view description);

}  // namespace veltrad::ctl
