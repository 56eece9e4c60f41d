// SPDX-License-Identifier: Apache-2.0
// The lab's answers, and how rules change them.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "directory.h"
#include "misbehaviour.h"

namespace veltrad::lab {

struct Answer {
  int status = 200;
  std::string type = "application/json";
  std::string body;
  // Values are texts.
  Dictionary headers;
};

// In the format of RFC 9110.
std::string httpDate(std::int64_t secondsSince1970);

// The signed container, or 304 without a body if the file is not newer than `ifModifiedSince` (which may be
// empty). A rule with a "bag" makes it newer.
Answer answerWithStorebag(const StorebagFile& file, const Directory& directory,
                          const std::optional<Rule>& rule, int maxAge, const std::string& ifModifiedSince);
// 404 or 500, with the reason as text.
Answer answerWithFailure(const StorebagFailure& failure);
// Changes status, body and headers as the rule says.
void applyRule(const Rule& rule, Answer& answer);

}  // namespace veltrad::lab
