// Error objects made and put on the wire. Any thread.
#include "wire/error.h"

#include "wire/constants.h"

namespace veltrad::wire {

ReportingError makeReportingError(std::string description, std::int64_t code) {
  return {kVeltraErrorDomain, code, std::move(description)};
}

Dictionary dictionaryOfError(const ReportingError& error) {
  return {{"domain", error.domain}, {"code", error.code}, {"description", error.description}};
}

}  // namespace veltrad::wire
