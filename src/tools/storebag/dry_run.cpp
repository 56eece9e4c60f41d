// SPDX-License-Identifier: Apache-2.0
// Makes the back end as a session does, and follows each message.
#include "storebag/dry_run.h"

#include <algorithm>

#include "formats/json.h"
#include "session/start_message.h"
#include "wire/constants.h"

namespace veltrad::storebag {
namespace {

backends::SharedDictionary shared(const std::optional<Dictionary>& dictionary) {
  return dictionary ? std::make_shared<const Dictionary>(*dictionary) : nullptr;
}

Dictionary sessionInfoOf(const Given& given) {
  return {{wire::kVeltraSessionInfoSessionID, given.sessionID},
          {wire::kVeltraSessionInfoClientType, given.clientType},
          {wire::kVeltraSessionInfoClientVersion, unsigned{given.clientVersion}},
          {wire::kVeltraSessionInfoRequireUserInfo, given.requireUserInfo},
          {wire::kVeltraSessionInfoBatchEvent, given.batchEvents}};
}

}  // namespace

DryRun::DryRun(const Given& given, const std::string& name, const backends::SharedProfile& profile)
    : _given(given), _world(given, name), _decision(_world.gate.decision()), _sentUserInfo(given.userInfo) {
  if (_sentUserInfo) applyPolicy(*_sentUserInfo, _userInfoEdits);
  char deviceID[41] = {};
  _world.device.copyUniqueDeviceID(deviceID, sizeof deviceID);
  backends::SessionFacts facts;
  facts.device.udid = deviceID;
  facts.userInfo = shared(given.userInfo);
  facts.sentUserInfo = shared(_sentUserInfo);
  facts.combinedSessionIDString = "";
  config::StorebagSection section;
  section.backends.emplace(name, profile);
  const Dictionary sessionInfo = sessionInfoOf(given);
  const auto set = session::createBackends({_world.factory, _world.device, _world.library, _world.clock,
                                            _world.counters, *_decision, nullptr, false, &_notMade},
                                           &section, &sessionInfo, std::move(facts));
  if (!set || set->empty()) return;
  _backend = set->begin()->second;
  _backend->updateState();
  session::applyProhibitions(*set, *_decision);
}

void DryRun::applyPolicy(Dictionary& content, config::EditedFields& edits) const {
  if (_decision->fields) _decision->fields->apply(content, edits);
}

void DryRun::play() {
  send({0, 0, 0,
        session::startMessagePayload(_world.device, _world.library, _world.preferences, _world.locale)});
  for (const GivenMessage& message : _given.messages) send(message);
  const std::size_t dropped = droppedSoFar();
  _backend->flushMessagesWithCompletion(nullptr);
  takePosts(dropped, std::nullopt);
}

void DryRun::send(const GivenMessage& message) {
  const std::size_t number = _fates.size();
  std::optional<Dictionary> payload = message.payload;
  config::EditedFields edits;
  if (payload) applyPolicy(*payload, edits);
  _payloads.push_back(payload.value_or(Dictionary()));
  _edits.push_back(std::move(edits));
  std::size_t dropped = droppedSoFar();
  const backends::Sent sent =
      _backend->sendMessage(std::move(payload), {}, message.category, message.type, message.flag);
  if (sent.decision.reason == wire::Reason::post_url_nil) ++dropped;  // itself
  // A device has an energy log.
  const bool written = sent.decision.reason == wire::Reason::energy_log_failed;
  _fates.push_back({written ? wire::Fate::written : sent.decision.fate, std::nullopt});
  takePosts(dropped, sent.decision.fate == wire::Fate::posted ? std::optional(number) : std::nullopt);
  const bool waits = sent.decision.fate == wire::Fate::batched || sent.decision.fate == wire::Fate::held;
  if (waits) _batch.push_back(number);
}

// Events of a batch that do not leave.
std::size_t DryRun::droppedSoFar() const {
  using enum wire::Reason;
  return _world.counters.value(flushed_unreported) + _world.counters.value(batch_full) +
         _world.counters.value(post_url_nil);
}

// `own`: the message whose post is the last one; the posts before it are those of batches.
void DryRun::takePosts(std::size_t droppedBefore, std::optional<std::size_t> own) {
  const std::size_t dropped = std::min(droppedSoFar() - droppedBefore, _batch.size());
  for (std::size_t i = 0; i < dropped; ++i) _fates[_batch[i]].fate = wire::Fate::dropped;
  _batch.erase(_batch.begin(), _batch.begin() + static_cast<std::ptrdiff_t>(dropped));
  std::vector<KeptPosts::Post> posts = _world.posts.take();
  if (own && !posts.empty()) {
    settle(posts.back(), {*own});
    posts.pop_back();
  }
  for (const KeptPosts::Post& post : posts) settle(post, std::exchange(_batch, {}));
}

void DryRun::settle(const KeptPosts::Post& post, const std::vector<std::size_t>& messages) {
  const bool leaves = !_world.gate.refusal(false, http::hostName(post.url));
  const auto body = formats::parseJSON(post.body);
  const Dictionary* envelope = body ? body.value().asDictionary() : nullptr;
  const Array* events = envelope ? envelope->array("events") : nullptr;
  for (std::size_t i = 0; i < messages.size(); ++i) {
    _fates[messages[i]] = {leaves ? wire::Fate::posted : wire::Fate::dropped, std::nullopt};
    if (!leaves || !events || i >= events->size()) continue;
    _fates[messages[i]].url = post.url;
    if (const Dictionary* event = (*events)[i].asDictionary()) _events[messages[i]] = *event;
  }
}

}  // namespace veltrad::storebag
