// Backends made and told what they need to know.
#include "session/backend_set.h"

#include "backends/backend_factory.h"
#include "config/storebag_content.h"
#include "platform/clock.h"
#include "platform/log.h"
#include "support/device_identity.h"
#include "support/veltra.h"
#include "wire/constants.h"

namespace veltrad::session {

std::shared_ptr<const BackendSet> createBackends(const BackendMaking& making,
                                                 const config::StorebagSection* storebag,
                                                 const Dictionary* sessionInfo,
                                                 const backends::SharedDictionary& userInfo,
                                                 const std::string& deviceID) {
  if (!storebag) {
    logError("createBackends: Attempted to create backends with nil storebag");
    return nullptr;
  }
  if (!sessionInfo) {
    logError("createBackends: Attempted to create backends with nil session info");
    return nullptr;
  }
  const platform::TimeValue start = making.clock.now();
  const auto productVersion = making.device.deviceProductVersion();
  const auto buildVersion = making.device.deviceBuildVersion();
  const auto hardwareType = making.device.deviceProductType();
  const auto productFamily = making.device.deviceName();
  const bool isInternal = making.device.isInternalBuild();
  const std::string selfVersion = making.library.packageVersion();

  const std::int32_t clientType = sessionInfo->int32(wire::kVeltraSessionInfoClientType).value_or(0);
  const auto made = std::make_shared<BackendSet>();
  for (const auto& [name, profile] : storebag->backends) {
    const auto backend = making.factory.newBackendWithName(name, profile, productFamily, clientType,
                                                           {making.account, making.oneShot});
    if (!backend) continue;
    backend->setSessionID(sessionInfo->uint32(wire::kVeltraSessionInfoSessionID).value_or(0));
    backend->setCompType(clientType);
    backend->setClientVersion(sessionInfo->uint16(wire::kVeltraSessionInfoClientVersion).value_or(0));
    backend->setUdid(deviceID);
    backend->setProductVersion(productVersion);
    backend->setBuildVersion(buildVersion);
    backend->setHardwareType(hardwareType);
    backend->setIsInternal(isInternal);
    backend->setRequireUserInfo(
        sessionInfo->boolean(wire::kVeltraSessionInfoRequireUserInfo).value_or(false));
    backend->setBatchEvents(sessionInfo->boolean(wire::kVeltraSessionInfoBatchEvent).value_or(false));
    backend->setUserInfoDict(userInfo);
    backend->setSelfVersion(selfVersion);
    backend->setStartTimestamp(start);
    backend->setMemoryAccount(making.account);
    made->emplace(name, backend);
  }
  return made;
}

std::vector<std::string> reportingNames(const BackendSet& backends) {
  std::vector<std::string> names;
  for (const auto& [name, backend] : backends) {
    const std::int32_t state = backend->state();
    if (state == backends::kBackendReporting || state == backends::kBackendHeld)
      names.push_back(backend->name());
  }
  return names;
}

}  // namespace veltrad::session
