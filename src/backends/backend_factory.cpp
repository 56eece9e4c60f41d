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

// A random source that returns the sampling factor decided before.
class FixedDraw final : public platform::Random {
 public:
  explicit FixedDraw(double draw) : _draw(draw) {}
  double uniform() override { return _draw; }

 private:
  const double _draw;
};
}  // namespace

std::shared_ptr<VeltraBackend> BackendFactory::newBackendWithName(
    const std::string& name, const SharedProfile& profile, const std::optional<std::string>& productFamily,
    const SharedFacts& facts, bool oneShot, const std::optional<double>& draw) {
  auto made = make(name, profile, productFamily, *facts, oneShot, draw);
  if (!made) return nullptr;
  made->setFacts(facts);
  made->keepFates(_services.fates);
  return made;
}

std::shared_ptr<VeltraBackend> BackendFactory::make(const std::string& name, const SharedProfile& profile,
                                                    const std::optional<std::string>& productFamily,
                                                    const SessionFacts& facts, [[maybe_unused]] bool oneShot,
                                                    const std::optional<double>& draw) {
  const std::string family = productFamily.value_or("");
  const auto known = draw                 ? draw
                     : _services.sampling ? _services.sampling->stableFactor(facts.compType, name)
                                          : std::nullopt;
  FixedDraw fixed(known.value_or(0));
  platform::Random& random = known ? fixed : _services.random;
#ifdef VELTRA_DASHBOARD
  if (name == wire::kVeltraBackendDashboard) {
    return DashboardBackend::initWithName(
        {random, _services.clock, _services.counters, _services.pool, _logData, _dashboards, facts.account,
         oneShot, _services.gate, _services.fates},
        name, std::get_if<config::DashboardProfile>(profile.get()), family);
  }
#endif
  if (name == wire::kVeltraBackendUploadServer) {
    return UploadBackend::initWithName(
        {random, _files, _services.http, _services.lentFiles, _services.counters, _services.scratchDirectory},
        name, std::get_if<config::UploadProfile>(profile.get()), family);
  }
  if (name == wire::kVeltraBackendHTTPPost || name == wire::kVeltraBackendHTTPPost2) {
    return HTTPSPostBackend::initWithName(
        {random,
         _services.locale,
         _services.counters,
         _posts,
         {_services.fates, name},
         {_services.preferences, _services.library, _services.settings},
         _services.gate},
        name, {profile, std::get_if<config::HTTPSPostProfile>(profile.get())}, productFamily);
  }
  if (name == wire::kVeltraBackendAmpery) {
    return AmperyBackend::initWithName(_services.energyLog, _services.counters, random, name, family);
  }
#ifdef VELTRA_ADAPTOR
  if (name == wire::kVeltraBackendMivo && !_services.device.mayHaveProductType(kProductTypeWithoutMivo)) {
    return MivoBackend::initWithName(_services.adaptorBundle, _services.counters, random, name, family,
                                     facts.compType);
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
