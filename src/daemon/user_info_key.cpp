// User-info keys.
#include "daemon/user_info_key.h"

#include "base/text.h"
#include "wire/constants.h"

namespace veltrad::daemon {

std::string userInfoKeyForUserInfo(const Dictionary* userInfo) {
  const std::string* client = userInfo ? userInfo->string(wire::kVeltraUserInfoClientName) : nullptr;
  const std::string* service = userInfo ? userInfo->string(wire::kVeltraUserInfoServiceName) : nullptr;
  return (client ? lowerCase(*client) : "") + ":" + (service ? lowerCase(*service) : "");
}

}  // namespace veltrad::daemon
