// What a call was answered, what came beside answers, and the one line that says so. Plain values and pure
// functions; any thread.
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
  veltra_status status = VELTRA_OK;  // anything else: the call ended without an answer, and `error` says why
  std::optional<std::string> reply;
  std::optional<std::vector<std::string>> backends;
  std::optional<wire::ReportingError> error;
  bool uploaded = false;
  bool removed = false;  // an uploaded file
};

// A copy of a message, for a session that aggregates. All empty: aggregation has ended.
struct AggregatedCopy {
  std::optional<Dictionary> sessionInfo;
  double timestamp = 0;  // seconds since 1970
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;
};

// For a call that never left: the status in words.
Answer answerOfFailure(veltra_status status);

// JSON without a line break, "op" first. "error" stands in every answer of a flush and of uploaded log data,
// and in others only when the call ended without an answer.
std::string formatAnswer(Operation operation, const Answer& answer);
// {"op":"aggregated","sessionInfo":…,"timestamp":…,"category":…,"type":…,"payload":…}; null where absent.
std::string formatAggregated(const AggregatedCopy& copy);
// {"op":"error","line":N,"description":"…"}; lines count from 1.
std::string formatMalformedLine(std::uint64_t line, std::string_view description);

}  // namespace veltrad::ctl
