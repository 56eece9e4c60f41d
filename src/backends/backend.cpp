// SPDX-License-Identifier: Apache-2.0
// The default behaviour of back ends.
#include "backends/backend.h"

#include <openssl/evp.h>

#include <cstdlib>
#include <limits>
#include <utility>

#include "base/text.h"

namespace veltrad::backends {

VeltraBackend::VeltraBackend(std::string name, std::string productFamily, platform::Random& random)
    : _name(std::move(name)), _productFamily(std::move(productFamily)), _samplingFactor(random.uniform()) {}

std::string VeltraBackend::convertIntoSHA256(std::string_view text) {
  unsigned char digest[32];
  unsigned length = 0;
  if (EVP_Digest(text.data(), text.size(), digest, &length, EVP_sha256(), nullptr) != 1) std::abort();
  return hex({reinterpret_cast<const char*>(digest), length});
}

void VeltraBackend::updateState() {
  setState({kBackendReporting, wire::Reason::always});
}

Sent VeltraBackend::sendMessage(std::optional<Dictionary> payload, platform::TimeValue timestamp,
                                std::uint16_t method, std::uint16_t respCode, std::int32_t flag,
                                const MessageNote& note) {
  ++_eventID;
  return sendNumberedMessage({std::move(payload), timestamp, method, respCode, _eventID, flag, note});
}

Sent VeltraBackend::sendNumberedMessage(NumberedMessage&& message) {
  return settled(message, wire::Decision());
}

wire::StepEntry VeltraBackend::stepOf(const NumberedMessage& message) {
  wire::StepEntry step = stepOf(message.note);
  step.time = platform::FateRing::microseconds(message.timestamp);
  step.eventNumber = message.eventID;
  return step;
}

wire::StepEntry VeltraBackend::stepOf(const MessageNote& note) {
  wire::StepEntry step;
  step.message = note.number;
  if (_pen.writes()) step.standing = _standing.of(_pen, standing());
  return step;
}

Sent VeltraBackend::settled(const NumberedMessage& message, wire::Decision decision) {
  static constexpr std::pair<wire::Fate, wire::Step> kSteps[] = {
      {wire::Fate::none, wire::Step::none},
      {wire::Fate::dropped, wire::Step::dropped},
      {wire::Fate::written, wire::Step::written},
      {wire::Fate::delivered, wire::Step::delivered}};
  for (const auto& [fate, step] : kSteps) {
    if (_pen.writes() && fate == decision.fate) _pen.write(step, decision.reason, stepOf(message));
  }
  return {decision, std::nullopt};
}

wire::StandingEntry VeltraBackend::standing() const {
  const StateVerdict verdict = stateVerdict();
  const ClientMatch match = clientMatch();
  const auto place = [](const std::optional<std::size_t>& at) {
    return at ? static_cast<std::int32_t>(*at) : -1;
  };
  wire::StandingEntry entry;
  entry.backend = _pen.backend();
  entry.state = static_cast<std::uint8_t>(verdict.state);
  entry.reason = static_cast<std::uint8_t>(verdict.reason);
  entry.differs = static_cast<std::uint8_t>((match.clientDiffers ? wire::StandingEntry::clientDiffers : 0) |
                                            (match.serviceDiffers ? wire::StandingEntry::serviceDiffers : 0));
  entry.entry = place(match.entry);
  entry.nearest = place(match.nearest);
  entry.draw = _samplingFactor;
  entry.threshold = samplingThreshold().value_or(std::numeric_limits<double>::quiet_NaN());
  return entry;
}

// Back ends that override it keep the completion, hence by value.
// NOLINTNEXTLINE(performance-unnecessary-value-param)
std::optional<std::string> VeltraBackend::flushMessagesWithCompletion(FlushCompletion completion) {
  if (completion) completion(std::nullopt, std::nullopt);
  return std::nullopt;
}

bool VeltraBackend::uploadFileAtPath(const std::string&, const std::string&, const MessageNote&) {
  return false;
}

bool VeltraBackend::uploadLogData(const Array&, const MessageNote&) {
  return false;
}

SharedFacts VeltraBackend::facts() const {
  const Lock held(_mutex);
  return _facts;
}

void VeltraBackend::setFacts(SharedFacts facts) {
  const Lock held(_mutex);
  _facts.swap(facts);
}

void VeltraBackend::setUserInfoDict(const UserInfo& info) {
  const Lock held(_mutex);
  auto changed = std::make_shared<SessionFacts>(*_facts);
  changed->take(info);
  changed->client = clientOf(*changed);
  _facts = std::move(changed);
}

void VeltraBackend::setCorrelatedSessionID(const std::string& sessionID) {
  const Lock held(_mutex);
  auto changed = std::make_shared<SessionFacts>(*_facts);
  changed->combinedSessionIDString = sessionID;
  _facts = std::move(changed);
}

void VeltraBackend::takeIdentity(const std::string& udid) {
  const Lock held(_mutex);
  auto changed = std::make_shared<SessionFacts>(*_facts);
  changed->device.udid = udid;
  _facts = std::move(changed);
}

std::optional<double> VeltraBackend::samplingThreshold() const {
  const Lock held(_mutex);
  return _samplingThreshold;
}

void VeltraBackend::setSamplingThreshold(std::optional<double> value) {
  const Lock held(_mutex);
  _samplingThreshold = value;
}

void VeltraBackend::setProhibition(std::optional<wire::Reason> reason) {
  _prohibition.store(reason ? static_cast<int>(*reason) : -1, std::memory_order_relaxed);
  if (reason) dropWaiting();
}

BackendActivity VeltraBackend::activity() const {
  const Lock held(_mutex);
  return {0, _postsUnderWay.load(std::memory_order_relaxed), _lastOutcome};
}

void VeltraBackend::postEnded(std::string outcome) {
  _postsUnderWay.fetch_sub(1, std::memory_order_relaxed);
  const Lock held(_mutex);
  _lastOutcome.swap(outcome);
}

}  // namespace veltrad::backends
