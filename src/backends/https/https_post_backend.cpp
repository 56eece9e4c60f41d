// The HTTPS post backend: what becomes of a message, and the flush. Its state stands in https_post_state.cpp.
#include "backends/https/https_post_backend.h"

#include <fmt/printf.h>

#include "backends/https/event.h"
#include "backends/https/json_message.h"
#include "config/process_settings.h"
#include "platform/counters.h"
#include "platform/locale.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::backends {

namespace {
constexpr std::uint16_t kSessionTypeStop = 1;

wire::Reason reasonOf(http::HTTPError::Kind kind) {
  switch (kind) {
    case http::HTTPError::Kind::transport:
    case http::HTTPError::Kind::tooLarge:  // never for a post: its answer is not kept
      return wire::Reason::post_failed;
    case http::HTTPError::Kind::tooMany:
      return wire::Reason::too_many_posts;
    case http::HTTPError::Kind::shortage:
      return wire::Reason::post_shortage;
    case http::HTTPError::Kind::stopping:
      return wire::Reason::post_stopped;
  }
  return wire::Reason::post_failed;
}

bool meansRealtime(std::int32_t flag) {
  return flag == 1 || flag == 3;
}
bool meansSamplingOverride(std::int32_t flag) {
  return flag == 2 || flag == 3;
}
}  // namespace

std::optional<std::string> HTTPSPostBackend::sendMessage(const Dictionary* payload,
                                                         platform::TimeValue timestamp, std::uint16_t method,
                                                         std::uint16_t respCode, std::uint16_t eventID,
                                                         std::int32_t flag) {
  if (state() == kBackendDisabled) {
    _services.counters.count(wire::Reason::backend_disabled);
    return std::nullopt;
  }
  Dictionary stopPayload;
  if (respCode == kSessionTypeStop) {
    logDebug(
        "HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP message "
        "dictionary");
    if (payload) {
      stopPayload = withStopFields(payload);
      payload = &stopPayload;
    } else {
      logError("HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil");
    }
  }
  const std::uint64_t sessionIDChanges = _held->sessionIDChanges();  // before the event is built
  Dictionary event = createEventDictfromPayload(*this, payload, timestamp, method, respCode, eventID,
                                                _services.locale.timeZoneOffset());
  prepareEventForMessage(event);
  if (meansSamplingOverride(flag) && state() == kBackendHeld) setState(kBackendReporting);
  const bool realtime = meansRealtime(flag);
  logDebug("HTTPSPostBackend(sendMessage): realtime is %d", realtime ? 1 : 0);

  const std::int32_t now = state();
  const bool userInfoMissing = requireUserInfo() && !userInfoDict();
  if (now == kBackendWaiting || now == kBackendHeld || (!realtime && batchEvents()) || userInfoMissing) {
    logDebug("HTTPSPostBackend(sendMessage): Batching %d, %d, %d", now, batchEvents(), requireUserInfo());
    return batchEvent(std::move(event), sessionIDChanges);
  }
  return postEvent(std::move(event), realtime, method, respCode, flag);
}

std::optional<std::string> HTTPSPostBackend::postEvent(Dictionary event, bool realtime, std::uint16_t method,
                                                       std::uint16_t respCode, std::int32_t flag) {
  std::optional<std::string> flushed;
  if (realtime && !_held->empty()) {
    logDebug(
        "HTTPSPostBackend(sendMessage): Got a realtime event and some events have already been batched. "
        "Forcing Flush "
        "here to keep events in order.");
    flushed = flushMessagesWithCompletion(nullptr);
  }
  logDebug("HTTPSPostBackend(sendMessage): Sending %d, %d, %d", state(), batchEvents(), requireUserInfo());
  restrict(event);
  std::optional<platform::Charge> charge{std::in_place};
  if (memoryAccount()) {
    charge = memoryAccount()->tryCharge(sizeOfEvent(event).charged, platform::MemoryUse::kept);
  }
  if (!charge) {
    refusePost(1, nullptr);
    return flushed;
  }
  std::vector<Dictionary> events;
  events.push_back(std::move(event));
  std::optional<std::string> pretty;
  std::string json = createMessageForPostAndLogging(std::move(events), pretty);
  std::optional<std::string> result = pretty;
  if (flushed) {
    result = "Flushed events:\n" + *flushed + "\nStandalone event:\n" + (pretty ? *pretty : "(null)");
  }
  postJSONMessage(std::move(json), flag, EventMap{method, respCode}, 1, std::move(*charge), 0, nullptr);
  return result;
}

Dictionary HTTPSPostBackend::withStopFields(const Dictionary* payload) const {
  Dictionary fields{{"Batch", batchEvents() ? 1u : 0u}, {"Opt", _dnuType}};
  const auto orMinusOne = [](const std::optional<double>& number) {
    return number ? Value(*number) : Value(-1);
  };
  fields.set("OverrideSampling", orMinusOne(_overrideSampling));
  fields.set("SamplingThreshold", orMinusOne(samplingThreshold()));
  Dictionary extended = *payload;
  extended.merge(fields);
  return extended;
}

void HTTPSPostBackend::prepareEventForMessage(Dictionary& event) const {
  if (const SharedDictionary userInfo = userInfoDict()) event.merge(*userInfo);
  filterEvent(event);
}

void HTTPSPostBackend::filterEvent(Dictionary& event) const {
  const FilterTable::Outcome outcome = _filters.filterEvent(event);
  if (outcome.removed > 0) _services.counters.count(wire::Reason::field_removed, outcome.removed);
  if (outcome.hashed > 0) _services.counters.count(wire::Reason::field_hashed, outcome.hashed);
}

std::optional<std::string> HTTPSPostBackend::batchEvent(Dictionary event, std::uint64_t sessionIDChanges) {
  // The event's own: user info and filters may have changed it.
  const std::int32_t method = event.int32("_method").value_or(0);
  // What no event may carry need not be kept until a flush takes it out.
  restrict(event);
  std::optional<std::string> flushed;
  const EventSize size = sizeOfEvent(event);
  const HeldEvents::Need need = _held->needOf(method, _eventThreshold, size);
  if (need == HeldEvents::Need::flush) {
    logDebug(
        "HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event threshold for method "
        "%d",
        method);
    flushed = flushMessagesWithCompletion(nullptr);
    _held->restartCount(method);
  } else if (need == HeldEvents::Need::bound && state() == kBackendReporting) {
    flushed = flushMessagesWithCompletion(nullptr);
  }
  _services.counters.count(keep(std::move(event), size, method, sessionIDChanges));
  return flushed;
}

// Batched, or there is no room for it, even without what the user's other batches hold.
wire::Reason HTTPSPostBackend::keep(Dictionary event, const EventSize& size, std::int32_t method,
                                    std::uint64_t sessionIDChanges) {
  platform::MemoryAccount* account = memoryAccount().get();
  auto charge = account ? account->keep(size.charged) : platform::Charge();
  if (!charge) return wire::Reason::event_over_share;
  if (account && !std::exchange(_evictable, true)) account->add(_held);
  _held->add(method, std::move(event), size, std::move(*charge), account ? account->nextTurn() : 0,
             sessionIDChanges);
  return wire::Reason::event_batched;
}

std::optional<std::string> HTTPSPostBackend::flushMessagesWithCompletion(FlushCompletion completion) {
  if (state() != kBackendReporting) {
    _services.counters.count(wire::Reason::flushed_unreported, _held->discard());
  }
  if (_held->empty()) {
    if (completion) completion(std::nullopt, wire::makeReportingError("Nothing to flush", -1));
    return std::nullopt;
  }
  const SharedDictionary userInfo = userInfoDict();
  if (requireUserInfo() && !userInfo) {
    if (completion)
      completion(std::nullopt, wire::makeReportingError("Can not flush: userInfo is required", -1));
    return std::nullopt;
  }
  logDebug("HTTPSPostBackend(flushMessagesWithCompletion): called");
  HeldEvents::Taken taken = _held->take();
  const std::size_t count = taken.events.size();
  if (userInfo) {
    Dictionary filtered = *userInfo;
    filterEvent(filtered);
    const std::size_t more = count * sizeOfEvent(filtered).charged;
    if (memoryAccount() && !memoryAccount()->keepMore(taken.charge, more)) {
      refusePost(count, completion);
      return std::nullopt;
    }
    for (Dictionary& event : taken.events) event.merge(filtered);
  }
  std::optional<std::string> pretty;
  std::string json = createMessageForPostAndLogging(std::move(taken.events), pretty);
  FlushCompletion whenPosted;
  std::size_t completionBytes = 0;
  if (completion) {
    completionBytes = pretty ? pretty->size() : 0;
    whenPosted = [completion = std::move(completion), pretty](const std::optional<std::string>&,
                                                              std::optional<wire::ReportingError> error) {
      completion(pretty, std::move(error));
    };
  }
  postJSONMessage(std::move(json), 0, std::nullopt, count, std::move(taken.charge), completionBytes,
                  std::move(whenPosted));
  return pretty;
}

void HTTPSPostBackend::setCorrelatedSessionID(const std::string& sessionID) {
  setCombinedSessionIDString(sessionID);
  _held->setSessionID(sessionID);
}

void HTTPSPostBackend::restrict(Dictionary& event) const {
  _services.counters.count(wire::Reason::field_not_json, restrictEventForJSON(event));
}

std::string HTTPSPostBackend::createMessageForPostAndLogging(std::vector<Dictionary> events,
                                                             std::optional<std::string>& pretty) {
  const double postTime = platform::timevalToSeconds(_services.clock.now());
  for (Dictionary& event : events) restrict(event);
  JSONMessage message = makeJSONMessage(postTime, clientIdentifier(), std::move(events), loggingAllowed());
  pretty = std::move(message.pretty);
  return std::move(message.compact);
}

const std::string& HTTPSPostBackend::clientIdentifier() const {
  if (isInternal() && _extrasOnInternal != 0) return udid();
  if (_uuidCustom) return *_uuidCustom;
  return _dnuType != 0 ? _uuidOverrideDnu : _uuidRespectDnu;
}

bool HTTPSPostBackend::loggingAllowed() const {
  if (_dnuType == 0 && _dnuEnabled) return true;
  if (!_forceEventLogging) return false;
  const auto environment = _services.settings.currentEnvironment();  // nothing: for now nobody can say
  return environment == 1 || environment == 2;
}

void HTTPSPostBackend::postJSONMessage(std::string json, std::int32_t withFlag,
                                       std::optional<EventMap> eventMap, std::size_t eventCount,
                                       platform::Charge charge, std::size_t completionBytes,
                                       FlushCompletion completion) {
  const auto& url = meansRealtime(withFlag) ? _realtimePostURL : _postURL;
  if (!url) {
    _services.counters.count(wire::Reason::post_url_nil, eventCount);
    if (completion) completion(std::nullopt, wire::makeReportingError("postURL is nil", -1));
    return;
  }
  http::HTTPRequest request = makePostRequest(*this, *url, std::move(json), eventMap);
  request.sequence = reinterpret_cast<std::uintptr_t>(this);
  request.charge = std::move(charge);
  if (memoryAccount() && !request.charge.resize(http::keptBytes(request) + completionBytes)) {
    return refusePost(eventCount, completion);
  }
  auto self = std::static_pointer_cast<HTTPSPostBackend>(shared_from_this());
  const auto answered = [self, postedTo = *url, eventCount,
                         completion = std::move(completion)](const http::HTTPResult& result) {
    auto error = self->handleAnswer(result, postedTo, eventCount);
    if (completion) completion(std::nullopt, std::move(error));
  };
  if (const auto started = _services.http.start(std::move(request), answered); !started)
    answered(Failure{started.error()});
}

void HTTPSPostBackend::refusePost(std::size_t eventCount, const FlushCompletion& completion) {
  const http::HTTPError refusal{http::HTTPError::Kind::tooMany, "Too many posts under way"};
  auto error = handleAnswer(Failure{refusal}, {}, eventCount);
  if (completion) completion(std::nullopt, std::move(error));
}

std::optional<wire::ReportingError> HTTPSPostBackend::handleAnswer(const http::HTTPResult& result,
                                                                   const std::string& url,
                                                                   std::size_t eventCount) {
  std::optional<wire::ReportingError> error;
  if (!result.ok()) {
    const std::string& description = result.error().description;
    _errors.happened(description);
    logDebug("HTTPSPostBackend(postJsonMessage): posted to %s", url.c_str());
    error = wire::makeReportingError(description, -1);
  }
  const int status = result.ok() ? result.value().status : result.error().status;
  const PostVerdict verdict = verdictOfStatus(status);
  const bool answered = result.ok() || verdict.disablesBackend;
  _services.counters.count(answered ? verdict.reason : reasonOf(result.error().kind), eventCount);
  if (!verdict.disablesBackend) return error;
  const std::string text = fmt::sprintf("backend %s disabled by server %d return code", name(), status);
  logInfo("postJSONMessage: %s", text.c_str());
  setState(kBackendDisabled);
  return wire::makeReportingError(text, status);
}

}  // namespace veltrad::backends
