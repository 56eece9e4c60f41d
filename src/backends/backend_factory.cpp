// The names of the backends and the kinds behind them.
#include "backends/backend_factory.h"

#include "backends/dashboard/dashboard_backend.h"
#include "backends/https/https_post_backend.h"
#include "platform/log.h"
#include "protocol/constants.h"

namespace veltrad {

std::shared_ptr<VeltraBackend> StandardBackendFactory::newBackendWithName(
    const std::string& name, const Value& profile, const std::optional<std::string>& productFamily,
    std::int32_t) {
  if (name == kVeltraBackendDashboard) {
    return DashboardBackend::initWithName(_services, _uploads, name, profile.asDictionary(),
                                          productFamily.value_or(""));
  }
  if (name == kVeltraBackendHTTPPost || name == kVeltraBackendHTTPPost2) {
    return HTTPSPostBackend::initWithName(_services, name, profile.asDictionary(), productFamily);
  }
  logError("VeltraBackend(newBackendWithName): %s", name.c_str());
  return nullptr;
}

}  // namespace veltrad
