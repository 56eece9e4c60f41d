// SPDX-License-Identifier: Apache-2.0
// Passes the services to the rooms.
#include "daemon/daemon.h"

#include "platform/log.h"

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
      _storebags(services.http, _settings, _library, _choices, _storebagStore, services.counters),
      _agent({_factory, _device, _library, services.clock, services.preferences, services.locale,
              services.counters, _flushes, _messageLog, services.gate, &_fates},
             _storebags, services.transaction) {}

void Daemon::hearOwner() {
  const bool changed = _services.gate.refresh();
  if (changed) {
    const auto word = _services.gate.word();
    logInfo("hearOwner: The owner's word has changed: %s",
            word->refusal ? wire::entryOf(*word->refusal).name.data() : "back ends may report");
    _agent.tellOwnersWord(*word);
    _factory.dropWaiting([&word](const std::string& host) {
      return word->refusal.has_value() || !word->policy->reaches(host);
    });
  }
  if (changed || _graceRuns) _services.http.endRefused(!changed);
  _graceRuns = changed;
}

void Daemon::readConfigurationAgain() {
  _services.entitlements.readAgain();
  _services.device.readAgain();
  _settings.readDeploymentAgain();
  _choices.readAgain();
  _services.policy.readAgain();
  hearOwner();
}

}  // namespace veltrad::daemon
