// Passes the services to the rooms.
#include "daemon/daemon.h"

namespace veltrad::daemon {

Daemon::Daemon(Services& services)
    : _library(services.files, services.preferences, services.root),
      _device(services.device),
      _settings(services.preferences, _device, services.files, services.root.deploymentPath()),
      _messageLog(services.clock, services.root.messageLogDirectory(), services.writer, services.counters),
      _factory({services.http, services.clock, services.random, services.locale, services.preferences,
                services.counters, services.energyLog, services.adaptorBundle, _settings, _device, _library,
                services.pool, services.lentFiles, services.root.preferencesDirectory()}),
      _storebags(services.http, _settings, _library),
      _agent({_factory, _device, _library, services.clock, services.preferences, services.locale,
              services.counters, _flushes, _messageLog},
             _storebags, services.transaction) {}

}  // namespace veltrad::daemon
