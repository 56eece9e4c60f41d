// What a call was answered, and the one line that says so. Plain values and pure functions; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/ctl/operation.h"
#include "veltra/veltra.h"

namespace veltrad::ctl {

struct AnswerError {
  std::string domain;
  std::int64_t code = -1;
  std::string description;
};

struct Answer {
  veltra_status status = VELTRA_OK;  // anything else: the call ended without an answer, and `error` says why
  std::optional<std::string> reply;
  std::optional<std::vector<std::string>> backends;
  std::optional<AnswerError> error;
};

// For a call that never left: the status in words.
Answer answerOfFailure(veltra_status status);

// JSON without a line break, "op" first. "error" stands in every answer of a flush, and in others only when
// the call ended without an answer.
std::string formatAnswer(Operation operation, const Answer& answer);
// {"op":"error","line":N,"description":"…"}; lines count from 1.
std::string formatMalformedLine(std::uint64_t line, std::string_view description);

}  // namespace veltrad::ctl
