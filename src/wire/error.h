// SPDX-License-Identifier: Apache-2.0
// The error object of replies.
#pragma once

#include <cstdint>
#include <string>

#include "base/value.h"

namespace veltrad::wire {

struct ReportingError {
  std::string domain;
  // -1 for local failures, else the HTTP status with which a server refused.
  std::int64_t code = -1;
  std::string description;
  bool operator==(const ReportingError&) const = default;
};

// In the domain kVeltraErrorDomain.
ReportingError makeReportingError(std::string description, std::int64_t code);

// {"domain", "code", "description"}
Dictionary dictionaryOfError(const ReportingError& error);
// Missing values, or those of another type, are empty; the code is then -1.
ReportingError errorOfDictionary(const Dictionary& dictionary);

// The error of a call whose callback the daemon destroyed without calling it.
inline constexpr const char* kNoReplyDescription = "The daemon gave no reply.";

}  // namespace veltrad::wire
