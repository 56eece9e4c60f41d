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
[[maybe_unused]] constexpr const char* kProductTypeWithoutMivo = "Halvorn";
}  // namespace

std::shared_ptr<VeltraBackend> BackendFactory::newBackendWithName(
    const std::string& name, const SharedProfile& profile, const std::optional<std::string>& productFamily,
    [[maybe_unused]] std::int32_t clientType, [[maybe_unused]] const BackendOwner& owner) {
  const std::string family = productFamily.value_or("");
#ifdef VELTRA_DASHBOARD
  if (name == wire::kVeltraBackendDashboard) {
    return DashboardBackend::initWithName(
        {_services.random, _services.clock, _services.counters, _services.pool, _logData, _dashboards, owner},
        name, std::get_if<config::DashboardProfile>(profile.get()), family);
  }
#endif
  if (name == wire::kVeltraBackendUploadServer) {
    return UploadBackend::initWithName({_services.random, _files, _services.http, _services.lentFiles,
                                        _services.counters, _services.scratchDirectory},
                                       name, std::get_if<config::UploadProfile>(profile.get()), family);
  }
  if (name == wire::kVeltraBackendHTTPPost || name == wire::kVeltraBackendHTTPPost2) {
    return HTTPSPostBackend::initWithName(
        {_services.random,
         _services.locale,
         _services.counters,
         _posts,
         {_services.preferences, _services.library, _services.settings}},
        name, {profile, std::get_if<config::HTTPSPostProfile>(profile.get())}, productFamily);
  }
  if (name == wire::kVeltraBackendAmpery) {
    return AmperyBackend::initWithName(_services.energyLog, _services.counters, _services.random, name,
                                       family);
  }
#ifdef VELTRA_ADAPTOR
  if (name == wire::kVeltraBackendMivo && !_services.device.mayHaveProductType(kProductTypeWithoutMivo)) {
    return MivoBackend::initWithName(_services.adaptorBundle, _services.counters, _services.random, name,
                                     family, clientType);
  }
#endif
  logError("VeltraBackend(newBackendWithName): %s", name.c_str());
  return nullptr;
}

}  // namespace veltrad::backends
