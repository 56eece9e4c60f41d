// SPDX-License-Identifier: Apache-2.0
// Builds events.
#include "backends/https/event.h"

#include <fmt/format.h>

#include "backends/https/json_message.h"
#include "config/client_types.h"

namespace veltrad::backends {

namespace {
std::int32_t coarsenedStart(double startTimeStamp) {
  const auto start = static_cast<std::int32_t>(static_cast<std::int64_t>(startTimeStamp));
  return start / 60 * 60;
}
}  // namespace

std::string senderCode(std::int32_t compType) {
  const char* code = config::senderCodeForComponentType(compType);
  return code ? code : "";
}

Dictionary createEventDictfromPayload(const SessionFacts& facts, const std::string& productFamily,
                                      const NumberedMessage& message, int timeZoneOffset) {
  const DeviceFacts& device = facts.device;
  const std::int32_t startTS = coarsenedStart(facts.startTimeStamp);
  const double clientTS =
      finiteOrMinusOne(startTS + (platform::timevalToSeconds(message.timestamp) - facts.startTimeStamp));

  // The keys are sorted by their bytes, so that neither the list nor the merge has to sort them.
  std::vector<Dictionary::Entry> fields;
  fields.reserve(17);
  const auto add = [&fields](const char* key, Value value) { fields.emplace_back(key, std::move(value)); };
  if (device.buildVersion) add("_build", *device.buildVersion);
  add("_clientTS", clientTS);
  add("_clientVersion", unsigned{facts.clientVersion});
  add("_eventNumber", unsigned{message.eventID});
  add("_internal", 3u);
  add("_method", unsigned{message.method});
  if (device.productVersion) add("_osVersion", *device.productVersion);
  add("_productFamily", productFamily);
  if (device.hardwareType) add("_productModel", *device.hardwareType);
  add("_reportVers", fmt::format("{}.{}", facts.selfVersion.major, facts.selfVersion.minor));
  add("_sender", senderCode(facts.compType));
  if (device.isInternal && isAdaptorClientType(facts.compType)) {
    add("_sessionID", facts.sessionID);
  } else if (facts.combinedSessionIDString) {
    add("_sessionID", *facts.combinedSessionIDString);
  }
  add("_startTS", startTS);
  add("_status", unsigned{message.respCode});
  add("_timezoneOffset", timeZoneOffset);
  add("eventTime", clientTS);

  Dictionary event = message.payload ? *message.payload : Dictionary{};
  event.merge(Dictionary::fromEntries(std::move(fields)));
  return event;
}

}  // namespace veltrad::backends
