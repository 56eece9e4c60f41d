// SPDX-License-Identifier: Apache-2.0
// Builds events.
#include "backends/https/event.h"

#include <iterator>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "backends/https/json_message.h"
#include "config/client_types.h"

namespace veltrad::backends {

namespace {
std::int32_t coarsenedStart(double startTimeStamp) {
  const auto start = static_cast<std::int32_t>(static_cast<std::int64_t>(startTimeStamp));
  return start / 60 * 60;
}

constexpr std::size_t kFixedFields = 17;

// Merges fields into a payload in one pass. The fields are added in the order of their keys' bytes.
class FieldMerge {
 public:
  // `more` is how many entries will be added, also later.
  FieldMerge(Dictionary payload, std::size_t more)
      : _payload(std::move(payload).takeEntries()), _next(_payload.begin()) {
    _entries.reserve(_payload.size() + more);
  }
  void add(std::string_view key, Value value) {
    while (_next != _payload.end()) {
      const int order = std::string_view(_next->first).compare(key);
      if (order > 0) break;
      if (order < 0) _entries.push_back(std::move(*_next));
      ++_next;
    }
    _entries.emplace_back(key, std::move(value));
  }
  Dictionary merged() && {
    std::move(_next, _payload.end(), std::back_inserter(_entries));
    return Dictionary::fromEntries(std::move(_entries));
  }

 private:
  std::vector<Dictionary::Entry> _payload;
  std::vector<Dictionary::Entry>::iterator _next;
  std::vector<Dictionary::Entry> _entries;
};

std::string versionText(SelfVersion version) {
  std::string text = std::to_string(version.major);
  return text.append(1, '.').append(std::to_string(version.minor));
}
}  // namespace

std::string senderCode(std::int32_t compType) {
  const char* code = config::senderCodeForComponentType(compType);
  return code ? code : "";
}

Dictionary createEventDictfromPayload(const SessionFacts& facts, const std::string& productFamily,
                                      NumberedMessage& message, int timeZoneOffset) {
  const DeviceFacts& device = facts.device;
  const std::int32_t startTS = coarsenedStart(facts.startTimeStamp);
  const double clientTS =
      finiteOrMinusOne(startTS + (platform::timevalToSeconds(message.timestamp) - facts.startTimeStamp));

  const std::size_t userFields = facts.sentUserInfo ? facts.sentUserInfo->size() : 0;
  FieldMerge event(message.payload ? std::move(*message.payload) : Dictionary(), kFixedFields + userFields);
  if (device.buildVersion) event.add("_build", *device.buildVersion);
  event.add("_clientTS", clientTS);
  event.add("_clientVersion", unsigned{facts.clientVersion});
  event.add("_eventNumber", unsigned{message.eventID});
  event.add("_internal", 3u);
  event.add("_method", unsigned{message.method});
  if (device.productVersion) event.add("_osVersion", *device.productVersion);
  event.add("_productFamily", productFamily);
  if (device.hardwareType) event.add("_productModel", *device.hardwareType);
  event.add("_reportVers", versionText(facts.selfVersion));
  event.add("_sender", senderCode(facts.compType));
  if (device.isInternal && isAdaptorClientType(facts.compType)) {
    event.add("_sessionID", facts.sessionID);
  } else if (facts.combinedSessionIDString) {
    event.add("_sessionID", *facts.combinedSessionIDString);
  }
  event.add("_startTS", startTS);
  event.add("_status", unsigned{message.respCode});
  event.add("_timezoneOffset", timeZoneOffset);
  event.add("eventTime", clientTS);
  return std::move(event).merged();
}

}  // namespace veltrad::backends
