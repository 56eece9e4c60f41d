// Connects the daemon's rooms. Main thread.
#pragma once

#include "backends/backend_factory.h"
#include "config/process_settings.h"
#include "config/storebag_section.h"
#include "daemon/services.h"
#include "daemon/veltrad_agent.h"
#include "session/flush_counters.h"
#include "support/device_identity.h"
#include "support/message_log.h"
#include "support/veltra.h"

namespace veltrad::daemon {

// The objects between the services and the listener. The services outlive it; it outlives the listener.
class Daemon {
 public:
  explicit Daemon(Services& services);
  VeltradAgent& agent() { return _agent; }
  backends::BackendFactory& backends() { return _factory; }
  config::ProcessSettings& settings() { return _settings; }
  config::StorebagSource& storebags() { return _storebags; }

 private:
  support::Veltra _library;
  support::DeviceIdentity _device;
  config::ProcessSettings _settings;
  support::MessageLog _messageLog;
  session::FlushCounters _flushes;
  backends::BackendFactory _factory;
  config::StorebagSections _storebags;
  VeltradAgent _agent;
};

}  // namespace veltrad::daemon
