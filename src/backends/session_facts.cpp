// SPDX-License-Identifier: Apache-2.0
// Names a session's client.
#include "backends/session_facts.h"

#include <functional>

#include "base/null_value.h"
#include "wire/constants.h"

namespace veltrad::backends {

std::uint32_t connectionNumber(std::string_view sessionIDString) {
  return static_cast<std::uint32_t>(std::hash<std::string_view>()(sessionIDString));
}

SharedDictionary clientOf(const SessionFacts& facts) {
  const auto textOrNull = [&facts](const char* key) {
    const Dictionary* info = facts.sentUserInfo.get();
    return orNull(info ? info->string(key) : nullptr);
  };
  return std::make_shared<const Dictionary>(
      Dictionary{{"clientType", facts.compType},
                 {"sessionID", facts.sessionID},
                 {"client", textOrNull(wire::kVeltraUserInfoClientName)},
                 {"service", textOrNull(wire::kVeltraUserInfoServiceName)}});
}

Dictionary aboutDeparture(const std::string& backend, const SessionFacts& facts,
                          std::optional<std::size_t> entry, const config::EditedFields& edits) {
  return {{"backend", backend},
          {"storebag", orNull(facts.storebag)},
          {"entry", orNull(entry)},
          {"removed", Array(edits.removed.begin(), edits.removed.end())},
          {"hashed", Array(edits.hashed.begin(), edits.hashed.end())}};
}

}  // namespace veltrad::backends
