// Event building.
#include "backends/https/event.h"

#include <fmt/format.h>

#include <cmath>

#include "backends/backend.h"
#include "config/client_types.h"

namespace veltrad::backends {

namespace {
// Bit n stands for client type n: 7, 11 and 13.
constexpr std::uint32_t kNumericSessionIDTypes = 0x2880;

std::int32_t coarsenedStart(double startTimeStamp) {
  const auto start = static_cast<std::int32_t>(static_cast<std::int64_t>(startTimeStamp));
  return start / 60 * 60;
}

double finiteOrMinusOne(double seconds) {
  return std::isfinite(seconds) ? seconds : -1.0;
}
}  // namespace

std::string senderCode(std::int32_t compType) {
  const char* code = config::senderCodeForComponentType(compType);
  return code ? code : "";
}

bool reportsNumericSessionID(bool isInternal, std::int32_t compType) {
  return isInternal && compType >= 0 && compType <= 13 && (kNumericSessionIDTypes >> compType & 1u) != 0;
}

Dictionary createEventDictfromPayload(const VeltraBackend& backend, const Dictionary* payload,
                                      platform::TimeValue timestamp, std::uint16_t method,
                                      std::uint16_t respCode, std::uint16_t eventID, int timeZoneOffset) {
  const std::int32_t startTS = coarsenedStart(backend.startTimeStamp());
  const double clientTS =
      finiteOrMinusOne(startTS + (platform::timevalToSeconds(timestamp) - backend.startTimeStamp()));

  // In the order of the keys' bytes, so that neither the list nor the merge needs sorting.
  std::vector<Dictionary::Entry> fields;
  fields.reserve(17);
  const auto add = [&fields](const char* key, Value value) { fields.emplace_back(key, std::move(value)); };
  if (backend.buildVersion()) add("_build", *backend.buildVersion());
  add("_clientTS", clientTS);
  add("_clientVersion", unsigned{backend.clientVersion()});
  add("_eventNumber", unsigned{eventID});
  add("_internal", 3u);
  add("_method", unsigned{method});
  if (backend.productVersion()) add("_osVersion", *backend.productVersion());
  add("_productFamily", backend.productFamily());
  if (backend.hardwareType()) add("_productModel", *backend.hardwareType());
  add("_reportVers", fmt::format("{}.{}", backend.selfVersionMajor(), backend.selfVersionMinor()));
  add("_sender", senderCode(backend.compType()));
  if (reportsNumericSessionID(backend.isInternal(), backend.compType())) {
    add("_sessionID", backend.sessionID());
  } else if (const auto combined = backend.combinedSessionIDString()) {
    add("_sessionID", *combined);
  }
  add("_startTS", startTS);
  add("_status", unsigned{respCode});
  add("_timezoneOffset", timeZoneOffset);
  add("eventTime", clientTS);

  Dictionary event = payload ? *payload : Dictionary{};
  event.merge(Dictionary::fromEntries(std::move(fields)));
  return event;
}

}  // namespace veltrad::backends
