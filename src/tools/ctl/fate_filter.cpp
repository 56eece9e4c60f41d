// SPDX-License-Identifier: Apache-2.0
// Compares a message with the filter.
#include "tools/ctl/fate_filter.h"

#include "support/fate_reader.h"

namespace veltrad::ctl {

namespace {
template <typename T>
bool same(const std::optional<T>& wanted, const std::optional<T>& given) {
  return !wanted || wanted == given;
}

template <typename T>
std::optional<T> ifKnown(std::uint8_t known, std::uint8_t which, T value) {
  return (known & which) != 0 ? std::optional(value) : std::nullopt;
}
}  // namespace

bool fits(const FateFilter& filter, const support::ToldMessage& message) {
  using Message = wire::MessageEntry;
  using Session = wire::SessionEntry;
  const Message& entry = message.entry;
  const support::ToldSession& session = *message.session;
  const Session& of = session.entry;
  if (filter.uploads != (entry.item != Message::Item::message)) return false;
  return same(filter.message, std::optional(entry.message & ~wire::kNoMessage)) &&
         same(filter.clientType, ifKnown(of.known, Session::clientTypeKnown, of.clientType)) &&
         same(filter.sessionID, ifKnown(of.known, Session::sessionIDKnown, of.sessionID)) &&
         same(filter.clientVersion, ifKnown(of.known, Session::clientVersionKnown, of.clientVersion)) &&
         same(filter.client, session.client) && same(filter.service, session.service) &&
         same(filter.category, ifKnown(entry.known, Message::categoryKnown, entry.category)) &&
         same(filter.type, ifKnown(entry.known, Message::typeKnown, entry.type)) &&
         same(filter.flag, std::optional(entry.flag));
}

}  // namespace veltrad::ctl
