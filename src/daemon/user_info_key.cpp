// User-info keys.
#include "daemon/user_info_key.h"

#include "base/text.h"
#include "protocol/constants.h"

namespace veltrad {

std::string userInfoKeyForUserInfo(const Dictionary* userInfo) {
  const std::string* client = userInfo ? userInfo->string(kVeltraUserInfoClientName) : nullptr;
  const std::string* service = userInfo ? userInfo->string(kVeltraUserInfoServiceName) : nullptr;
  return (client ? lowerCase(*client) : "") + ":" + (service ? lowerCase(*service) : "");
}

}  // namespace veltrad
