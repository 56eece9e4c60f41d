// The daemon's rooms wired by hand, and the order in which they stop. Main thread.
#pragma once

#include <chrono>
#include <cstddef>

#include "backends/backend_factory.h"
#include "config/process_settings.h"
#include "config/storebag_section.h"
#include "daemon/veltrad_agent.h"
#include "platform/services.h"
#include "protocol/veltra.h"
#include "session/flush_counters.h"
#include "support/device_identity.h"
#include "support/message_log.h"

namespace veltrad {

// Everything between the platform's services and the listener. The services outlive it; it outlives the
// listener.
class Daemon {
 public:
  explicit Daemon(platform::Services& services);
  VeltradAgent& agent() { return _agent; }
  StandardBackendFactory& backends() { return _factory; }

 private:
  Veltra _library;
  DeviceIdentity _device;
  ProcessSettings _settings;
  MessageLogFile _messageLog;
  FlushCounters _flushes;
  StandardBackendFactory _factory;
  StorebagSections _storebags;
  VeltradAgent _agent;
};

}  // namespace veltrad
