// SPDX-License-Identifier: Apache-2.0
// The facts about a session, its client and the device that its back ends use.
#pragma once

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"
#include "config/field_changes.h"
#include "platform/memory_budget.h"

namespace veltrad::backends {

using SharedDictionary = std::shared_ptr<const Dictionary>;

struct DeviceFacts {
  // The device's identifier; may be empty.
  std::string udid;
  std::optional<std::string> productVersion;
  std::optional<std::string> buildVersion;
  std::optional<std::string> hardwareType;
  bool isInternal = false;
};

// The version of the client library.
struct SelfVersion {
  // "9.3" gives 9 and 3, "10" gives 10 and 0; each modulo 256.
  static SelfVersion of(const std::string& version) {
    const auto number = [](const char* text) {
      return static_cast<std::uint8_t>(std::strtoll(text, nullptr, 10));
    };
    const std::size_t dot = version.find('.');
    return {number(version.c_str()), number(dot == std::string::npos ? "" : version.c_str() + dot + 1)};
  }

  std::uint8_t major = 0;
  std::uint8_t minor = 0;
};

// The user info as the client gave it, what of it may leave the device, and what differs. Each may be null.
struct UserInfo {
  SharedDictionary given;
  SharedDictionary sent;
  config::SharedEdits edits;
};

// The pointers may be null.
// Its 16 fields are all that back ends read of their session.
struct SessionFacts {
  DeviceFacts device;
  SelfVersion selfVersion;
  std::uint32_t sessionID = 0;
  // Another one for each connection; 0: not known.
  std::uint32_t connection = 0;
  // The client type.
  std::int32_t compType = 0;
  std::uint16_t clientVersion = 0;
  bool requireUserInfo = false;
  // A client entry of the storebag may override it.
  bool batchEvents = false;
  // Seconds since 1970.
  double startTimeStamp = 0;
  // As the client gave it: it chooses the client entry and the family, and does not leave the device.
  SharedDictionary userInfo;
  // The user info that may leave: without the fields that the owner of the device withholds.
  SharedDictionary sentUserInfo;
  // The differences between the two.
  config::SharedEdits userInfoEdits;
  // The description of the client for the owner of the device, made of the fields above.
  SharedDictionary client;
  // The storebag of the back ends: {"name", "version", "section"}.
  SharedDictionary storebag;
  std::optional<std::string> combinedSessionIDString;
  // Pays for what is kept.
  std::shared_ptr<platform::MemoryAccount> account;

  void take(const UserInfo& info) {
    userInfo = info.given;
    sentUserInfo = info.sent;
    userInfoEdits = info.edits;
  }
};
using SharedFacts = std::shared_ptr<const SessionFacts>;

// `sessionIDString`: 16 random bytes as a text.
std::uint32_t connectionNumber(std::string_view sessionIDString);
// {"clientType", "sessionID", "client", "service"}; names that may not leave are not among them.
SharedDictionary clientOf(const SessionFacts& facts);
// The other fields of a departure in the history: {"backend", "storebag", "entry", "removed", "hashed"}.
// `entry`: the number of the client entry, counted from 0.
Dictionary aboutDeparture(const std::string& backend, const SessionFacts& facts,
                          std::optional<std::size_t> entry, const config::EditedFields& edits);

// Client types 7, 11 and 13: they have an adaptor, and numeric session IDs on internal builds.
constexpr bool isAdaptorClientType(std::int32_t clientType) {
  return clientType == 7 || clientType == 11 || clientType == 13;
}

}  // namespace veltrad::backends
