// SPDX-License-Identifier: Apache-2.0
// Passes the services to the rooms.
#include "daemon/daemon.h"

namespace veltrad::daemon {

namespace {
std::size_t bytesForFates(config::OperatorSettings& settings) {
  const auto choices = settings.current();
  return static_cast<std::size_t>((choices ? *choices : config::OperatorChoices()).fates.bytes);
}
}  // namespace

Daemon::Daemon(Services& services)
    : _services(services),
      _library(services.files, services.preferences, services.root),
      _device(services.device),
      _settings(services.preferences, _device, services.files, services.root.deploymentPath()),
      _choices(services.files, services.root.settingsPath()),
      _fates(bytesForFates(_choices), services.clock),
      _sampling(_choices, services.secret),
      _messageLog(services.clock, services.root.messageLogDirectory(), services.writer, services.counters),
      _factory({services.http, services.clock, services.random, services.locale, services.preferences,
                services.counters, services.energyLog, services.adaptorBundle, _settings, _choices, _device,
                _library, services.pool, services.lentFiles, services.root.preferencesDirectory(), &_sampling,
                &services.gate, &_fates}),
      _storebagStore(services.files, services.clock, services.root.storebagsDirectory()),
      _seenStorebags(services.files, services.root.seenStorebagsPath()),
      _storebagTrust(_library, services.files, _seenStorebags, services.clock, services.counters,
                     services.root.keysDirectory()),
      _storebags(services.http, _settings, _library, _storebagTrust, _choices, _storebagStore,
                 services.counters),
      _agent({_factory, _device, _library, services.clock, services.preferences, services.locale,
              services.counters, _flushes, _messageLog, services.gate, &_fates},
             _storebags, services.transaction),
      _follower(_agent, _choices),
      _privacy(services, _agent, _factory, _library) {}

void Daemon::readConfigurationAgain() {
  _services.entitlements.readAgain();
  _services.device.readAgain();
  _settings.readDeploymentAgain();
  _choices.readAgain();
  _services.policy.readAgain();
  _privacy.hearOwner();
}

}  // namespace veltrad::daemon
