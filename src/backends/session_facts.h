// What a session tells its back ends of itself, its client and the device. Plain values.
#pragma once

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>

#include "base/value.h"

namespace veltrad::platform {
class MemoryAccount;
}  // namespace veltrad::platform

namespace veltrad::backends {

using SharedDictionary = std::shared_ptr<const Dictionary>;

struct DeviceFacts {
  std::string udid;  // the device's identifier; may be empty
  std::optional<std::string> productVersion;
  std::optional<std::string> buildVersion;
  std::optional<std::string> hardwareType;
  bool isInternal = false;
};

// Of the client library.
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

struct SessionFacts {
  DeviceFacts device;
  SelfVersion selfVersion;
  std::uint32_t sessionID = 0;
  std::int32_t compType = 0;  // the client type
  std::uint16_t clientVersion = 0;
  bool requireUserInfo = false;
  bool batchEvents = false;   // unless a client entry says otherwise
  double startTimeStamp = 0;  // seconds since 1970
  SharedDictionary userInfo;  // null: none
  std::optional<std::string> combinedSessionIDString;
  std::shared_ptr<platform::MemoryAccount> account;  // charged with what is kept; null: nobody pays
};

}  // namespace veltrad::backends
