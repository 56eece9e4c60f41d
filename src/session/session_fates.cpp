// SPDX-License-Identifier: Apache-2.0
// Makes the entries of sessions and messages.
#include "session/session_fates.h"

#include "config/field_change_recorder.h"
#include "session/routing.h"
#include "session/session_delegate.h"
#include "wire/constants.h"

namespace veltrad::session {

NotMade* SessionFates::comesFrom(const config::StorebagOrigin& origin,
                                 backends::SharedDictionary sessionInfo) {
  _origin = origin;
  _sessionInfo = std::move(sessionInfo);
  _notMade.clear();
  forget();
  return &_notMade;
}

void SessionFates::describe(const FamilyFacts& facts, From from) {
  using Entry = wire::SessionEntry;
  if (!_pen.writes()) return;
  _sentUserInfo = facts.sentUserInfo;
  Entry entry;
  if (const Dictionary* info = (_sessionInfo ? _sessionInfo : facts.sessionInfo).get()) {
    const auto take = [&entry](auto& into, const auto& value, Entry::Known known) {
      if (!value) return;
      into = *value;
      entry.known = static_cast<std::uint8_t>(entry.known | known);
    };
    take(entry.clientType, info->int32(wire::kVeltraSessionInfoClientType), Entry::clientTypeKnown);
    take(entry.sessionID, info->uint32(wire::kVeltraSessionInfoSessionID), Entry::sessionIDKnown);
    take(entry.clientVersion, info->uint16(wire::kVeltraSessionInfoClientVersion), Entry::clientVersionKnown);
  }
  const auto name = [&](const char* key) -> wire::FateRef {
    const std::string* text = facts.sentUserInfo ? facts.sentUserInfo->string(key) : nullptr;
    return text ? _pen.textOf(*text) : 0;
  };
  if (from != From::oneShot) entry.session = _pen.textOf(facts.sessionIDString);
  entry.client = name(wire::kVeltraUserInfoClientName);
  entry.service = name(wire::kVeltraUserInfoServiceName);
  if (!_origin.name.empty()) {
    entry.storebag = _pen.textOf(_origin.name);
    entry.section = _pen.textOf(_origin.section);
    if (_origin.version) entry.version = _pen.textOf(*_origin.version);
  }
  for (std::size_t i = 0; i < std::min(_notMade.size(), Entry::kNotMade); ++i) {
    entry.notMade[i] = _pen.textOf(_notMade[i].first);
    entry.notMadeReasons[i] = static_cast<std::uint8_t>(_notMade[i].second);
  }
  _session = _pen.ring()->write(entry);
}

void SessionFates::taken(Message& message, From from, const config::EditedFields* edits,
                         std::optional<wire::Reason> reason, const std::string& copyTo) {
  message.note.edits = edits;
  if (!_pen.writes()) return;
  wire::MessageEntry entry;
  entry.from = from;
  entry.session = platform::FateRing::refTo(_session);
  entry.message = _pen.ring()->nextMessage();
  entry.time = edits ? platform::FateRing::microseconds(message.time) : _pen.ring()->now();
  entry.category = message.category;
  entry.type = message.type;
  entry.flag = message.flag;
  if (reason) entry.reason = static_cast<std::uint8_t>(*reason);
  if (reason == wire::Reason::no_category) entry.known = 0;
  if (reason == wire::Reason::no_type) entry.known = wire::MessageEntry::categoryKnown;
  if (!copyTo.empty()) entry.aggregatedTo = _pen.textOf(copyTo);
  _pen.ring()->contents().keep(entry.message, message.payload ? &*message.payload : nullptr,
                               _sentUserInfo.get());
  _pen.ring()->write(entry);
  message.note.number = entry.message;
  message.note.session = entry.session;
  if (edits && !edits->empty())
    config::FieldChangeRecorder(_pen, {.time = entry.time, .message = entry.message}).changed(*edits);
  if (entry.aggregatedTo == 0) return;
  wire::StepEntry step;
  step.message = entry.message;
  step.text = entry.aggregatedTo;
  _pen.write(wire::Step::aggregated, std::nullopt, step);
}

void SessionFates::refused(const FamilyFacts& facts, Message message, From from, wire::Reason why) {
  if (from == From::oneShot || !described()) describe(facts, from);
  taken(message, from, nullptr, why);
}

backends::MessageNote SessionFates::taken(Item item) {
  if (!_pen.writes()) return {};
  wire::MessageEntry entry;
  entry.item = item;
  entry.known = 0;
  entry.session = platform::FateRing::refTo(_session);
  entry.message = wire::kNoMessage | _pen.newNumber();
  entry.time = _pen.ring()->now();
  _pen.ring()->write(entry);
  return {nullptr, entry.message, entry.session};
}

}  // namespace veltrad::session
