// SPDX-License-Identifier: Apache-2.0
// Names a session's client.
#include "backends/session_facts.h"

#include <functional>
#include <limits>

#include "wire/constants.h"

namespace veltrad::backends {

std::uint32_t connectionNumber(std::string_view sessionIDString) {
  return static_cast<std::uint32_t>(std::hash<std::string_view>()(sessionIDString));
}

SharedDictionary clientOf(const SessionFacts& facts) {
  const auto textOrNull = [&facts](const char* key) {
    const Dictionary* info = facts.sentUserInfo.get();
    const std::string* text = info ? info->string(key) : nullptr;
    return text ? Value(*text) : Value(std::numeric_limits<double>::quiet_NaN());
  };
  return std::make_shared<const Dictionary>(
      Dictionary{{"clientType", facts.compType},
                 {"sessionID", facts.sessionID},
                 {"client", textOrNull(wire::kVeltraUserInfoClientName)},
                 {"service", textOrNull(wire::kVeltraUserInfoServiceName)}});
}

Dictionary aboutDeparture(const std::string& backend, const SessionFacts& facts,
                          std::optional<std::size_t> entry, const config::EditedFields& edits) {
  const Value none = std::numeric_limits<double>::quiet_NaN();
  return {{"backend", backend},
          {"storebag", facts.storebag ? Value(*facts.storebag) : none},
          {"entry", entry ? Value(*entry) : none},
          {"removed", Array(edits.removed.begin(), edits.removed.end())},
          {"hashed", Array(edits.hashed.begin(), edits.hashed.end())}};
}

}  // namespace veltrad::backends
