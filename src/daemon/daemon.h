// SPDX-License-Identifier: Apache-2.0
// Connects the daemon's rooms. Main thread.
#pragma once

#include <optional>
#include <string>

#include "backends/backend_factory.h"
#include "backends/https/post_spool.h"
#include "backends/https/spool_sender.h"
#include "backends/sampling_factors.h"
#include "config/operator_settings.h"
#include "config/process_settings.h"
#include "config/seen_storebags_file.h"
#include "config/storebag_section.h"
#include "config/storebag_store.h"
#include "config/storebag_trust.h"
#include "daemon/privacy.h"
#include "daemon/services.h"
#include "daemon/storebag_follower.h"
#include "daemon/veltrad_agent.h"
#include "platform/fate_ring.h"
#include "session/flush_counters.h"
#include "support/device_identity.h"
#include "support/message_log.h"
#include "support/veltra.h"

namespace veltrad::daemon {

// The objects between the services and the listener. The services must outlive it; it outlives the listener.
// Its 21 fields are these objects, in the order in which they need each other, whatever the padding.
// NOLINTNEXTLINE(clang-analyzer-optin.performance.Padding)
class Daemon {
 public:
  explicit Daemon(Services& services);
  VeltradAgent& agent() { return _agent; }
  backends::BackendFactory& backends() { return _factory; }
  Privacy& privacy() { return _privacy; }
  StorebagFollower& follower() { return _follower; }
  // Every file under etc/veltrad, now. Certificates are read by the first connection after they have changed.
  void readConfigurationAgain();
  config::ProcessSettings& settings() { return _settings; }
  config::StorebagSource& storebags() { return _storebags; }
  platform::FateRing& fates() { return _fates; }
  // Null if there is no spool: failed posts are lost.
  backends::PostSpool* spool() { return _spool ? &*_spool : nullptr; }
  // Sends the posts that this daemon or an earlier one has kept, or removes them if the operator has switched
  // the spool off. Called again each second, because a shortage may prevent it.
  void startSpool();
  // From now on nothing of the spool is sent.
  void stopSpool();

 private:
  // Why it has to be started again; empty: it has not.
  std::string runSpool();
  std::string removeSpool();

  Services& _services;
  support::Veltra _library;
  support::DeviceIdentity _device;
  config::ProcessSettings _settings;
  config::OperatorSettings _choices;
  platform::FateRing _fates;
  backends::SamplingFactors _sampling;
  std::optional<backends::PostSpool> _spool;
  support::MessageLog _messageLog;
  session::FlushCounters _flushes;
  backends::BackendFactory _factory;
  config::StorebagStore _storebagStore;
  config::SeenStorebagsFile _seenStorebags;
  config::StorebagTrust _storebagTrust;
  config::StorebagSections _storebags;
  VeltradAgent _agent;
  StorebagFollower _follower;
  Privacy _privacy;
  std::optional<backends::SpoolSender> _spoolSender;
  bool _spoolIsStarted = false;
  std::string _spoolTrouble;  // that was logged last
};

}  // namespace veltrad::daemon
