// What the lab answers before it misbehaves, and how a rule changes that. Pure functions; any thread.
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
  Dictionary headers;  // texts
};

// RFC 9110's date format.
std::string httpDate(std::int64_t secondsSince1970);

// The signed container, or 304 with nothing when the file is not newer than `ifModifiedSince` (empty: not
// asked).
Answer answerWithStorebag(const StorebagFile& file, const config::SigningKey& key, Rule::Signature sign,
                          int maxAge, const std::string& ifModifiedSince);
// 404 or 500, with the reason as text.
Answer answerWithFailure(const StorebagFailure& failure);
// Status, body and headers as the rule says.
void applyRule(const Rule& rule, Answer& answer);

}  // namespace veltrad::lab
