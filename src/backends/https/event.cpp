// SPDX-License-Identifier: Apache-2.0
// Builds events, and changes those that were built before.
#include "backends/https/event.h"

#include <algorithm>
#include <string>
#include <utility>

#include "backends/https/event_writer.h"
#include "backends/https/json_fields.h"
#include "config/client_types.h"
#include "formats/json.h"

namespace veltrad::backends {

namespace {
std::int32_t coarsenedStart(double startTimeStamp) {
  const auto start = static_cast<std::int32_t>(static_cast<std::int64_t>(startTimeStamp));
  return start / 60 * 60;
}

std::string versionText(SelfVersion version) {
  std::string text = std::to_string(version.major);
  return text.append(1, '.').append(std::to_string(version.minor));
}

std::int32_t numberIn(const Dictionary& fields, const char* key, std::int32_t otherwise) {
  return fields.contains(key) ? fields.int32(key).value_or(0) : otherwise;
}

// The values by which filters select events.
struct EventKind {
  std::int32_t method;
  std::int32_t status;
};

bool settles(const Dictionary& userInfo, const FilterTable& filters, EventKind event) {
  if (!fitsJSON(userInfo)) return false;
  if (filters.empty()) return true;
  const EventKind own{numberIn(userInfo, "_method", 0), numberIn(userInfo, "_status", 0)};
  return std::all_of(userInfo.begin(), userInfo.end(), [&](const auto& field) {
    return filters.actionOn(field.first, event.method, event.status) ==
           filters.actionOn(field.first, own.method, own.status);
  });
}

// Releases spare capacity if the length was not predicted, because the text may be kept for a long time.
void limitRoom(std::string& text) {
  constexpr std::size_t kMostSpare = 128;
  if (text.capacity() > text.size() + kMostSpare) text.shrink_to_fit();
}

void addFixedFields(EventWriter& writer, const SessionFacts& facts, const std::string& productFamily,
                    const NumberedMessage& message, int timeZoneOffset) {
  const DeviceFacts& device = facts.device;
  const std::int32_t startTS = coarsenedStart(facts.startTimeStamp);
  const double clientTS =
      finiteOrMinusOne(startTS + (platform::timevalToSeconds(message.timestamp) - facts.startTimeStamp));
  if (device.buildVersion) writer.add("_build", std::string_view(*device.buildVersion));
  writer.add("_clientTS", clientTS);
  writer.add("_clientVersion", unsigned{facts.clientVersion});
  writer.add("_eventNumber", unsigned{message.eventID});
  writer.add("_internal", 3u);
  writer.add("_method", unsigned{message.method});
  if (device.productVersion) writer.add("_osVersion", std::string_view(*device.productVersion));
  writer.add("_productFamily", std::string_view(productFamily));
  if (device.hardwareType) writer.add("_productModel", std::string_view(*device.hardwareType));
  writer.add("_reportVers", std::string_view(versionText(facts.selfVersion)));
  writer.add("_sender", std::string_view(senderCode(facts.compType)));
  if (device.isInternal && isAdaptorClientType(facts.compType)) {
    writer.add("_sessionID", facts.sessionID);
  } else if (facts.combinedSessionIDString) {
    writer.add("_sessionID", std::string_view(*facts.combinedSessionIDString));
  }
  writer.add("_startTS", startTS);
  writer.add("_status", unsigned{message.respCode});
  writer.add("_timezoneOffset", timeZoneOffset);
  writer.add("eventTime", clientTS);
}
}  // namespace

std::string senderCode(std::int32_t compType) {
  const char* code = config::senderCodeForComponentType(compType);
  return code ? code : "";
}

EventText eventText(const Dictionary& event) {
  return {formats::writeJSON(event), event.size()};
}

void changeEvent(EventText& event, const std::function<void(Dictionary&)>& change) {
  auto read = formats::parseJSON(event.json);
  auto fields = read ? std::move(read.value()).takeDictionary() : std::nullopt;
  if (!fields) return;  // it is no dictionary if filters have left nothing but a field like "$date"
  change(*fields);
  event = eventText(*fields);
}

WrittenEvent writeEvent(const SessionFacts& facts, const std::string& productFamily,
                        const NumberedMessage& message, int timeZoneOffset, const FilterTable& filters,
                        std::size_t expectedBytes) {
  static const Dictionary kNone;
  const Dictionary& userInfo = facts.sentUserInfo ? *facts.sentUserInfo : kNone;
  const EventKind kind{numberIn(userInfo, "_method", message.method),
                       numberIn(userInfo, "_status", message.respCode)};
  WrittenEvent event;
  event.text.json.reserve(expectedBytes);
  {
    EventWriter writer(message.payload ? *message.payload : kNone, userInfo, filters, kind.method,
                       kind.status, event);
    addFixedFields(writer, facts, productFamily, message, timeZoneOffset);
    writer.finish();
  }
  limitRoom(event.text.json);
  const bool sendsMethod =
      filters.empty() || filters.actionOn("_method", kind.method, kind.status) == config::FilterAction::keep;
  event.method = sendsMethod ? kind.method : 0;
  event.settled = settles(userInfo, filters, kind);
  return event;
}

}  // namespace veltrad::backends
