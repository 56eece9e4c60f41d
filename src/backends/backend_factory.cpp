// The names of the backends and the kinds behind them.
#include "backends/backend_factory.h"

#include "backends/ampery/ampery_backend.h"
#include "backends/dashboard/dashboard_backend.h"
#include "backends/https/https_post_backend.h"
#include "backends/mivo/mivo_backend.h"
#include "backends/upload/upload_backend.h"
#include "platform/log.h"
#include "support/device_identity.h"
#include "wire/constants.h"

namespace veltrad::backends {

namespace {
// A device of this product type has no adaptor.
constexpr const char* kProductTypeWithoutMivo = "Halvorn";
}  // namespace

std::shared_ptr<VeltraBackend> StandardBackendFactory::newBackendWithName(
    const std::string& name, const SharedProfile& profile, const std::optional<std::string>& productFamily,
    std::int32_t clientType, const BackendOwner& owner) {
  if (name == wire::kVeltraBackendDashboard) {
    return DashboardBackend::initWithName({_services, _logData, _dashboards, owner}, name,
                                          std::get_if<config::DashboardProfile>(profile.get()),
                                          productFamily.value_or(""));
  }
  if (name == wire::kVeltraBackendUploadServer) {
    return UploadBackend::initWithName(_services, _files, name,
                                       std::get_if<config::UploadProfile>(profile.get()),
                                       productFamily.value_or(""));
  }
  if (name == wire::kVeltraBackendHTTPPost || name == wire::kVeltraBackendHTTPPost2) {
    return HTTPSPostBackend::initWithName(_services, _postErrors, name,
                                          {profile, std::get_if<config::HTTPSPostProfile>(profile.get())},
                                          productFamily);
  }
  if (name == wire::kVeltraBackendAmpery) {
    return AmperyBackend::initWithName(_services, name, productFamily.value_or(""));
  }
  if (name == wire::kVeltraBackendMivo && !_services.device.mayHaveProductType(kProductTypeWithoutMivo)) {
    return MivoBackend::initWithName(_services, name, productFamily.value_or(""), clientType);
  }
  logError("VeltraBackend(newBackendWithName): %s", name.c_str());
  return nullptr;
}

}  // namespace veltrad::backends
