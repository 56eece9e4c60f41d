// SPDX-License-Identifier: Apache-2.0
// Maps names to kinds of back ends.
#include "backends/backend_factory.h"

#include "backends/ampery/ampery_backend.h"
#include "backends/dashboard/dashboard_backend.h"
#include "backends/https/https_post_backend.h"
#include "backends/mivo/mivo_backend.h"
#include "backends/sampling_factors.h"
#include "backends/upload/upload_backend.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::backends {

namespace {
// Devices of this product type have no adaptor.
[[maybe_unused]] constexpr const char* kProductTypeWithoutMivo = "Halvorn";
}  // namespace

std::shared_ptr<VeltraBackend> BackendFactory::newBackendWithName(const std::string& name,
                                                                  const SharedProfile& profile,
                                                                  const SharedFacts& facts, bool oneShot,
                                                                  const std::optional<double>& draw) {
  const auto known = draw                 ? draw
                     : _services.sampling ? _services.sampling->stableFactor(facts->compType, name)
                                          : std::nullopt;
  auto made = make(name, profile, *facts, oneShot, known ? *known : _services.random.uniform());
  if (!made) return nullptr;
  made->setFacts(facts);
  made->keepFates(_services.fates);
  return made;
}

std::shared_ptr<VeltraBackend> BackendFactory::make(const std::string& name, const SharedProfile& profile,
                                                    const SessionFacts& facts, [[maybe_unused]] bool oneShot,
                                                    double draw) {
#ifdef VELTRA_DASHBOARD
  if (name == wire::kVeltraBackendDashboard) {
    return DashboardBackend::initWithName(
        {draw, _services.clock, _services.counters, _services.pool, _logData, _dashboards, facts.account,
         oneShot, _services.gate, _services.fates},
        name, std::get_if<config::DashboardProfile>(profile.get()));
  }
#endif
  if (name == wire::kVeltraBackendUploadServer) {
    return UploadBackend::initWithName(
        {draw, _files, _services.http, _services.lentFiles, _services.counters, _services.scratchDirectory},
        name, std::get_if<config::UploadProfile>(profile.get()));
  }
  if (name == wire::kVeltraBackendHTTPPost || name == wire::kVeltraBackendHTTPPost2) {
    if (!facts.device.productFamily) return nullptr;
    return HTTPSPostBackend::initWithName({draw,
                                           _services.locale,
                                           _services.counters,
                                           _posts,
                                           {_services.fates, name},
                                           {_services.preferences, _services.library, _services.settings},
                                           _services.gate},
                                          name,
                                          {profile, std::get_if<config::HTTPSPostProfile>(profile.get())});
  }
  if (name == wire::kVeltraBackendAmpery) {
    return AmperyBackend::initWithName(_services.energyLog, _services.counters, draw, name);
  }
#ifdef VELTRA_ADAPTOR
  if (name == wire::kVeltraBackendMivo && !_services.device.mayHaveProductType(kProductTypeWithoutMivo)) {
    return MivoBackend::initWithName(_services.adaptorBundle, _services.counters, draw, name, facts.compType);
  }
#endif
  logError("VeltraBackend(newBackendWithName): %s", name.c_str());
  _services.counters.count(wire::Reason::unknown_backend);
  return nullptr;
}

wire::Reason BackendFactory::whyNotMade(std::string_view name) {
  static constexpr std::pair<const char*, wire::Reason> kReasons[] = {
      {wire::kVeltraBackendDashboard, wire::Reason::bad_address},
      {wire::kVeltraBackendUploadServer, wire::Reason::no_post_url},
      {wire::kVeltraBackendHTTPPost, wire::Reason::no_clients},
      {wire::kVeltraBackendHTTPPost2, wire::Reason::no_clients},
      {wire::kVeltraBackendMivo, wire::Reason::client_type_not_served}};
  for (const auto& [kind, reason] : kReasons) {
    if (kind == name) return reason;
  }
  return wire::Reason::unknown_backend;
}

}  // namespace veltrad::backends
