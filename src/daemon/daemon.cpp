// SPDX-License-Identifier: Apache-2.0
// Passes the services to the rooms.
#include "daemon/daemon.h"

#include "platform/log.h"
#include "support/spool_folder.h"

namespace veltrad::daemon {

namespace {
std::size_t bytesForFates(config::OperatorSettings& settings) {
  const auto choices = settings.current();
  return static_cast<std::size_t>((choices ? *choices : config::OperatorChoices()).fates.bytes);
}

std::optional<backends::PostSpool> spoolOf(Services& services, config::OperatorSettings& settings,
                                           support::DeviceIdentity& device, platform::FateRing& fates) {
  const auto choices = settings.current();
  if (!choices || !choices->spool) return std::nullopt;
  const config::SpoolChoices& chosen = *choices->spool;
  return std::optional<backends::PostSpool>(
      std::in_place,
      backends::SpoolServices{services.clock,
                              services.counters,
                              services.files,
                              services.writer,
                              {services.gate, services.preferences, services.locale, device},
                              &fates},
      backends::SpoolSettings{services.root.spoolDirectory(),
                              {static_cast<std::uint64_t>(*chosen.bytes), *chosen.perUser},
                              *chosen.days,
                              {*chosen.postsPerSecond, *chosen.firstWait, *chosen.longestWait}});
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
      _spool(spoolOf(services, _choices, _device, _fates)),
      _messageLog(services.clock, services.root.messageLogDirectory(), services.writer, services.counters),
      _factory({services.http, services.clock, services.random, services.locale, services.preferences,
                services.counters, services.energyLog, services.adaptorBundle, _settings, _choices, _device,
                _library, services.pool, services.lentFiles, services.root.preferencesDirectory(), &_sampling,
                &services.gate, &_fates, spool()}),
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
      _privacy(services, _agent, _factory, _library, spool()) {}

void Daemon::startSpool() {
  if (_spoolIsStarted) return;
  const std::string trouble = _spool ? runSpool() : removeSpool();
  _spoolIsStarted = trouble.empty();
  if (trouble == _spoolTrouble) return;
  if (!trouble.empty()) logError("The spool is started again later: %s", trouble.c_str());
  if (trouble.empty()) logInfo("The spool is started");
  _spoolTrouble = trouble;
}

std::string Daemon::runSpool() {
  const auto made = _spool->folder().make();
  if (!_spoolSender) _spoolSender.emplace(*_spool, _services.http, _agent.storebags());
  if (!_spoolSender->start()) return "there is no thread or descriptor for it";
  return made ? std::string() : made.error();
}

// The settings are unknown while they cannot be read.
std::string Daemon::removeSpool() {
  const auto choices = _choices.current();
  if (!choices || choices->spool) return {};
  const support::SpoolFolder folder(_services.files, _services.root.spoolDirectory());
  const auto removed = folder.removeAll();
  _services.counters.eventTaken(removed.events);
  _services.counters.count(wire::Reason::by_hand, removed.events);
  _services.counters.count(wire::Reason::spool_torn, removed.torn);
  if (removed.posts + removed.torn > 0)
    logWarning("There is no \"spool\" in the settings: %llu kept posts are removed",
               static_cast<unsigned long long>(removed.posts + removed.torn));
  return removed.all ? std::string() : "files of an earlier one cannot be removed";
}

void Daemon::stopSpool() {
  if (_spoolSender) _spoolSender->stop();
}

void Daemon::readConfigurationAgain() {
  _services.entitlements.readAgain();
  _services.device.readAgain();
  _settings.readDeploymentAgain();
  _choices.readAgain();
  _services.policy.readAgain();
  _privacy.hearOwner();
}

}  // namespace veltrad::daemon
