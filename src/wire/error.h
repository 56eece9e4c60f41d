// The error object that answers carry. A plain value; any thread.
#pragma once

#include <cstdint>
#include <string>

#include "base/value.h"

namespace veltrad::wire {

struct ReportingError {
  std::string domain;       // kVeltraErrorDomain
  std::int64_t code = -1;   // -1 for local failures, else the HTTP status of a server's refusal
  std::string description;  // the message text
  bool operator==(const ReportingError&) const = default;
};

// Domain kVeltraErrorDomain.
ReportingError makeReportingError(std::string description, std::int64_t code);

// On the wire: {"domain", "code", "description"}.
Dictionary dictionaryOfError(const ReportingError& error);
// What is missing or of another type is empty.
ReportingError errorOfDictionary(const Dictionary& dictionary);

// Of a call whose callback the daemon let go without calling it.
inline constexpr const char* kNoReplyDescription = "The daemon gave no reply.";

}  // namespace veltrad::wire
