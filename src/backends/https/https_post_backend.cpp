// SPDX-License-Identifier: Apache-2.0
// Posts or batches messages, and flushes batches.
#include "backends/https/https_post_backend.h"

#include <algorithm>
#include <utility>

#include "backends/https/event_posts.h"
#include "backends/https/json_fields.h"
#include "config/field_change_recorder.h"
#include "config/owner_gate.h"
#include "platform/counters.h"
#include "platform/locale.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {
constexpr std::uint16_t kSessionTypeStop = 1;

bool meansRealtime(std::int32_t flag) {
  return flag == 1 || flag == 3;
}
bool meansSamplingOverride(std::int32_t flag) {
  return flag == 2 || flag == 3;
}
}  // namespace

std::shared_ptr<HTTPSPostBackend> HTTPSPostBackend::initWithName(
    const HTTPSPostMaking& making, const std::string& name,
    const std::shared_ptr<const config::HTTPSPostProfile>& profile,
    const std::optional<std::string>& productFamily) {
  if (!profile || !productFamily) return nullptr;
  if (!profile->clients) {
    logError("HTTPSPostBackend(initWithName): can't find the client list.");
    making.counters.count(wire::Reason::no_clients);
    return nullptr;
  }
  std::shared_ptr<HTTPSPostBackend> made(new HTTPSPostBackend(making, name, profile, *productFamily));
  if (!made->_clientState.identity().known()) {
    logError("HTTPSPostBackend(initWithName): the device's identifiers cannot be read just now.");
    return nullptr;
  }
  return made;
}

HTTPSPostBackend::HTTPSPostBackend(const HTTPSPostMaking& making, const std::string& name,
                                   const std::shared_ptr<const config::HTTPSPostProfile>& profile,
                                   const std::string& productFamily)
    : VeltraBackend(name, productFamily, making.random),
      _locale(making.locale),
      _counters(making.counters),
      _posts(making.posts),
      _gate(making.gate),
      _clientState(*this, profile, making.locale, making.counters, making.identity),
      _held(std::make_shared<HeldEvents>(making.counters, making.pen)) {
  setDisplayURL(profile->displayURL);
}

// New filters apply to the batched events only in the user info that the flush adds.
void HTTPSPostBackend::takeOver(VeltraBackend& before) {
  VeltraBackend::takeOver(before);
  auto* other = dynamic_cast<HTTPSPostBackend*>(&before);
  if (!other) return;
  _held = other->_held;
  _evictable = other->_evictable;
  _writtenInfo = other->_writtenInfo;
  _writtenFilters = other->_writtenFilters;
  _lastLength = other->_lastLength;
  _batchEdits = other->_batchEdits;
}

void HTTPSPostBackend::updateState() {
  setState(_clientState.updateBackendState());
}

std::vector<std::string> HTTPSPostBackend::hosts() const {
  std::vector<std::string> hosts;
  for (const auto& url : {_clientState.links().postURL(), _clientState.links().realtimePostURL()}) {
    if (url) hosts.push_back(http::hostName(*url));
  }
  return hosts;
}

void HTTPSPostBackend::dropWaiting() {
  const std::size_t dropped = _held->discard(wire::Reason::refused_by_owner);
  if (_gate) _gate->receipt().add(http::Departure::Kind::post, facts()->client, dropped);
}

BackendActivity HTTPSPostBackend::activity() const {
  BackendActivity activity = VeltraBackend::activity();
  activity.held = _held->size();
  return activity;
}

Sent HTTPSPostBackend::sendNumberedMessage(NumberedMessage&& message) {
  if (const StateVerdict verdict = stateVerdict(); verdict.state == kBackendDisabled) {
    _counters.count(wire::Reason::backend_disabled);
    return settled(message, {wire::Fate::dropped, verdict.reason});
  }
  _counters.eventTaken();
  // Read before the facts, so that a change between the two is noticed.
  const std::uint64_t sessionIDChanges = _held->sessionIDChanges();
  const auto facts = this->facts();
  const bool batching = _clientState.batchEvents(*facts);
  if (message.respCode == kSessionTypeStop) {
    logDebug(
        "HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP message "
        "dictionary");
    if (message.payload) {
      addStopFields(*message.payload, batching);
    } else {
      logError("HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil");
    }
  }
  WrittenEvent event = writeEvent(*facts, message);
  noteEdits(*facts, message, event.edits);
  addOwnersEdits(*facts, message.note, event.edits);
  if (meansSamplingOverride(message.flag) && state() == kBackendHeld) {
    setState({kBackendReporting, wire::Reason::reports});
  }
  const bool realtime = meansRealtime(message.flag);
  logDebug("HTTPSPostBackend(sendMessage): realtime is %d", realtime ? 1 : 0);

  const std::int32_t now = state();
  const bool userInfoMissing = facts->requireUserInfo && !facts->userInfo;
  if (now == kBackendWaiting || now == kBackendHeld || (!realtime && batching) || userInfoMissing) {
    logDebug("HTTPSPostBackend(sendMessage): Batching %d, %d, %d", now, batching, facts->requireUserInfo);
    return batchEvent(std::move(event), message, facts->account.get(), sessionIDChanges);
  }
  return postEvent(std::move(event), *facts, message);
}

WrittenEvent HTTPSPostBackend::writeEvent(const SessionFacts& facts, const NumberedMessage& message) {
  constexpr std::size_t kMoreOrLess = 64, kLongest = 8192;
  noteUserInfo(facts);
  WrittenEvent event = backends::writeEvent(facts, productFamily(), message, _locale.timeZoneOffset(),
                                            _clientState.filters(), _lastLength + kMoreOrLess);
  _lastLength = std::min(event.text.json.size(), kLongest);
  count(event.filtered);
  _counters.count(wire::Reason::field_not_json, event.notJSON);
  return event;
}

// Events that were written with other user info or filters get the present ones when they are flushed.
void HTTPSPostBackend::noteUserInfo(const SessionFacts& facts) {
  if (facts.sentUserInfo == _writtenInfo && _clientState.filters() == _writtenFilters) return;
  _held->unsettle();
  _writtenInfo = facts.sentUserInfo;
  _writtenFilters = _clientState.filters();
}

bool HTTPSPostBackend::recorded() const {
  return _gate != nullptr && _gate->keepsRecords();
}

void HTTPSPostBackend::addOwnersEdits(const SessionFacts& facts, const MessageNote& note,
                                      config::EditedFields& edits) const {
  if (!recorded()) return;
  if (note.edits) edits.add(*note.edits);
  if (facts.userInfoEdits) edits.add(*facts.userInfoEdits);
}

Dictionary HTTPSPostBackend::about(const SessionFacts& facts, const config::EditedFields& edits) const {
  return recorded() || _posts.keepsPosts() ? aboutDeparture(name(), facts, _clientState.entry(), edits)
                                           : Dictionary();
}

Sent HTTPSPostBackend::postEvent(WrittenEvent event, const SessionFacts& facts,
                                 const NumberedMessage& message) {
  const bool realtime = meansRealtime(message.flag);
  std::optional<std::string> flushed;
  if (realtime && !_held->empty()) {
    logDebug(
        "HTTPSPostBackend(sendMessage): Got a realtime event and some events have already been batched. "
        "Forcing Flush "
        "here to keep events in order.");
    flushed = flushMessagesWithCompletion(nullptr);
  }
  logDebug("HTTPSPostBackend(sendMessage): Sending %d, %d, %d", state(), _clientState.batchEvents(facts),
           facts.requireUserInfo);
  std::optional<platform::Charge> charge{std::in_place};
  const EventSize size = sizeOfEvent(event.text);
  if (facts.account) charge = facts.account->tryCharge(size.charged, platform::MemoryUse::kept);
  const wire::StepEntry fate = stepOf(message);
  if (!charge) {
    return {{wire::Fate::dropped, _posts.refusePost(*this, 1, nullptr, fate)}, std::move(flushed)};
  }
  std::vector<std::string> events;
  events.push_back(std::move(event.text.json));
  JSONMessage posted = createMessage(std::move(events), facts);
  std::optional<std::string> result = std::move(posted.pretty);
  if (flushed) {
    result = "Flushed events:\n" + *flushed + "\nStandalone event:\n" + result.value_or("(null)");
  }
  const PostLinks& links = _clientState.links();
  const wire::Reason why = stateVerdict().reason;  // before an answer can change it
  const auto ended =
      _posts.postJSONMessage(shared_from_this(), facts, realtime ? links.realtimePostURL() : links.postURL(),
                             {std::move(posted.text), EventMap{message.method, message.respCode}, 1,
                              std::move(*charge), 0, nullptr, about(facts, event.edits), fate});
  if (ended) return {*ended, std::move(result)};
  return {{wire::Fate::posted, why}, std::move(result)};
}

void HTTPSPostBackend::addStopFields(Dictionary& payload, bool batching) const {
  Dictionary fields{{"Batch", batching ? 1u : 0u}, {"Opt", _clientState.identity().dnuType()}};
  const auto orMinusOne = [](const std::optional<double>& number) {
    return number ? Value(*number) : Value(-1);
  };
  fields.set("OverrideSampling", orMinusOne(_clientState.overrideSampling()));
  fields.set("SamplingThreshold", orMinusOne(samplingThreshold()));
  payload.merge(fields);
}

void HTTPSPostBackend::count(const FilterTable::Outcome& outcome) const {
  if (outcome.removed > 0) _counters.count(wire::Reason::field_removed, outcome.removed);
  if (outcome.hashed > 0) _counters.count(wire::Reason::field_hashed, outcome.hashed);
}

Sent HTTPSPostBackend::batchEvent(WrittenEvent event, const NumberedMessage& message,
                                  platform::MemoryAccount* account, std::uint64_t sessionIDChanges) {
  const std::int32_t method = event.method;
  std::optional<std::string> flushed;
  const EventSize size = sizeOfEvent(event.text);
  const HeldEvents::Need need = _held->needOf(method, _clientState.eventThreshold(), size);
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
  if (recorded()) {
    if (_held->empty()) _batchEdits = {};
    _batchEdits.add(event.edits);
  }
  // Drops events of the user's other batches if necessary.
  auto charge = account ? account->keep(size.charged) : platform::Charge();
  const StateVerdict verdict = stateVerdict();
  const bool reports = verdict.state == kBackendReporting;
  Sent sent{{reports ? wire::Fate::batched : wire::Fate::held, verdict.reason}, std::move(flushed)};
  _counters.count(charge ? wire::Reason::event_batched : wire::Reason::event_over_share);
  if (!charge) {
    sent.decision = settled(message, {wire::Fate::dropped, wire::Reason::event_over_share}).decision;
    return sent;
  }
  if (account && !std::exchange(_evictable, true)) account->add(_held);
  _held->add(method, {std::move(event.text), size, account ? account->nextTurn() : 0, event.settled},
             std::move(*charge), sessionIDChanges, reports ? wire::Step::batched : wire::Step::held,
             stepOf(message));
  return sent;
}

std::optional<std::string> HTTPSPostBackend::flushMessagesWithCompletion(FlushCompletion completion) {
  if (state() != kBackendReporting) {
    _held->discard(wire::Reason::flushed_unreported);
  }
  if (_held->empty()) {
    if (completion) completion(std::nullopt, wire::makeReportingError("Nothing to flush", -1));
    return std::nullopt;
  }
  const auto facts = this->facts();
  if (facts->requireUserInfo && !facts->userInfo) {
    if (completion)
      completion(std::nullopt, wire::makeReportingError("Can not flush: userInfo is required", -1));
    return std::nullopt;
  }
  logDebug("HTTPSPostBackend(flushMessagesWithCompletion): called");
  noteUserInfo(*facts);
  HeldEvents::Taken taken = _held->take();
  const std::size_t count = taken.events.size();
  wire::StepEntry fate;
  fate.batch = taken.batch;
  pen().write(wire::Step::flushed, std::nullopt, fate);
  config::EditedFields edits = std::exchange(_batchEdits, {});
  if (facts->sentUserInfo && !mergeUserInfo(taken, *facts, edits)) {
    _posts.refusePost(*this, count, completion, fate);
    return std::nullopt;
  }
  std::vector<std::string> events;
  events.reserve(count);
  for (EventBatch::Event& event : taken.events) events.push_back(std::move(event.text.json));
  JSONMessage posted = createMessage(std::move(events), *facts);
  std::optional<std::string> pretty = std::move(posted.pretty);
  FlushCompletion whenPosted;
  std::size_t completionBytes = 0;
  if (completion) {
    completionBytes = pretty ? pretty->size() : 0;
    whenPosted = [completion = std::move(completion), pretty](const std::optional<std::string>&,
                                                              std::optional<wire::ReportingError> error) {
      completion(pretty, std::move(error));
    };
  }
  _posts.postJSONMessage(shared_from_this(), *facts, _clientState.links().postURL(),
                         {std::move(posted.text), std::nullopt, count, std::move(taken.charge),
                          completionBytes, std::move(whenPosted), about(*facts, edits), fate});
  return pretty;
}

bool HTTPSPostBackend::mergeUserInfo(HeldEvents::Taken& taken, const SessionFacts& facts,
                                     config::EditedFields& edits) {
  Dictionary info = *facts.sentUserInfo;
  config::EditedFields own;
  count(_clientState.filters().filterEvent(info, own));
  edits.add(own);
  addOwnersEdits(facts, {}, edits);
  const auto unsettled = static_cast<std::size_t>(std::count_if(
      taken.events.begin(), taken.events.end(), [](const auto& event) { return !event.settled; }));
  if (unsettled == 0) return true;
  noteMerge(facts, own, taken.batch);
  const std::size_t more = unsettled * sizeOfEvent(eventText(info)).charged;
  if (facts.account && !facts.account->keepMore(taken.charge, more)) return false;
  // The events themselves were restricted when they were written.
  const bool restricts = !fitsJSON(info);
  for (EventBatch::Event& event : taken.events) {
    if (event.settled) continue;
    changeEvent(event.text, [&](Dictionary& fields) {
      fields.merge(info);
      if (restricts) _posts.restrict(fields);
    });
  }
  return true;
}

void HTTPSPostBackend::noteEdits(const SessionFacts& facts, const NumberedMessage& message,
                                 const config::EditedFields& edits) const {
  if (edits.empty() && !facts.userInfoEdits) return;
  config::FieldChangeRecorder changes(
      pen(), {.time = platform::FateRing::microseconds(message.timestamp), .message = message.note.number});
  if (facts.userInfoEdits) changes.changed(*facts.userInfoEdits, message.note.edits);
  changes.changed(edits);
}

// The user info was filtered without the methods and statuses of the events, so that a field that an event's
// own filter had changed may leave as it is.
void HTTPSPostBackend::noteMerge(const SessionFacts& facts, const config::EditedFields& edits,
                                 std::uint64_t batch) const {
  if (!pen().writes()) return;
  const config::EditedFields* kept = facts.userInfoEdits.get();
  config::FieldChangeRecorder changes(pen(), {.time = pen().ring()->now(), .batch = batch});
  for (const auto& [name, value] : *facts.sentUserInfo) {
    if (edits.removed.contains(name)) continue;
    if (edits.hashed.contains(name) || (kept && kept->hashed.contains(name))) {
      changes.changed(config::FieldChange::hashed, name);
    } else if (_clientState.filters().concerns(name)) {
      changes.restored(name);
    }
  }
}

JSONMessage HTTPSPostBackend::createMessage(std::vector<std::string> events,
                                            const SessionFacts& facts) const {
  const PostIdentity& identity = _clientState.identity();
  return _posts.createMessageForPostAndLogging(std::move(events), identity.clientIdentifier(facts.device),
                                               identity.loggingAllowed());
}

void HTTPSPostBackend::takeIdentity(const std::string& udid) {
  VeltraBackend::takeIdentity(udid);
  _clientState.renewIdentifiers();
}

void HTTPSPostBackend::setCorrelatedSessionID(const std::string& sessionID) {
  VeltraBackend::setCorrelatedSessionID(sessionID);
  _held->setSessionID(sessionID);
}

}  // namespace veltrad::backends
