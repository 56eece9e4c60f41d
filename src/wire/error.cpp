// SPDX-License-Identifier: Apache-2.0
// Error objects and their dictionaries on the wire.
#include "wire/error.h"

#include "wire/constants.h"

namespace veltrad::wire {

namespace {
constexpr const char* kDomain = "domain";
constexpr const char* kCode = "code";
constexpr const char* kDescription = "description";
}  // namespace

ReportingError makeReportingError(std::string description, std::int64_t code) {
  return {kVeltraErrorDomain, code, std::move(description)};
}

Dictionary dictionaryOfError(const ReportingError& error) {
  return {{kDomain, error.domain}, {kCode, error.code}, {kDescription, error.description}};
}

ReportingError errorOfDictionary(const Dictionary& dictionary) {
  ReportingError error;
  if (const std::string* domain = dictionary.string(kDomain)) error.domain = *domain;
  const Value* code = dictionary.find(kCode);
  error.code = code ? code->toInt64().value_or(-1) : -1;
  if (const std::string* description = dictionary.string(kDescription)) error.description = *description;
  return error;
}

}  // namespace veltrad::wire
