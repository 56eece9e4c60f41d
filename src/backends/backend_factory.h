// SPDX-License-Identifier: Apache-2.0
// Makes back ends by name. Any thread.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "backends/backend.h"
#include "backends/dashboard/dashboard_queues.h"
#include "backends/dashboard/log_data_uploads.h"
#include "backends/https/event_posts.h"
#include "backends/upload/file_uploads.h"
#include "config/process_settings.h"
#include "config/storebag_content.h"
#include "platform/lent_files.h"
#include "platform/locale.h"
#include "platform/preferences.h"
#include "platform/random.h"
#include "support/device_identity.h"
#include "support/veltra.h"

namespace veltrad::config {
class OwnerGate;
}  // namespace veltrad::config

namespace veltrad::backends {

class CodeBundle;
class EnergyLog;
class SamplingFactors;
class WorkPool;

// Its 19 fields are the services of all kinds of back ends; the factory passes to each kind only those that
// it needs. All must outlive the back ends.
struct BackendServices {
  http::HTTPClient& http;
  platform::Clock& clock;
  platform::Random& random;
  platform::Locale& locale;
  platform::Preferences& preferences;
  platform::Counters& counters;
  EnergyLog& energyLog;
  CodeBundle& adaptorBundle;
  config::ProcessSettings& settings;
  config::OperatorSettings& choices;
  support::DeviceIdentity& device;
  const support::Veltra& library;
  WorkPool& pool;
  platform::LentFiles& lentFiles;
  // Where temporary files are made.
  std::string scratchDirectory = "/tmp";
  // If null, every sampling factor is drawn.
  SamplingFactors* sampling = nullptr;
  // If null, the owner sets no limits.
  config::OwnerGate* gate = nullptr;
  // If null, the fates of messages are not recorded.
  platform::FateRing* fates = nullptr;
  // If null, failed posts are lost.
  PostSpool* spool = nullptr;
};

// A back end's section of a storebag. Null for a back end that reads no section.
using SharedProfile = std::shared_ptr<const config::Profile>;

class BackendFactory {
 public:
  explicit BackendFactory(BackendServices services)
      : _services(services),
        _posts(services.http, services.clock, services.counters, services.choices, services.spool),
        _logData(services.http, services.counters) {}
  // Returns a back end that has these facts. Null, after one log line, if the name is unknown or the profile
  // is not sufficient. `oneShot`: the back end serves a single message instead of a session. `draw`: its
  // sampling factor, if it is not to draw one.
  std::shared_ptr<VeltraBackend> newBackendWithName(const std::string& name, const SharedProfile& profile,
                                                    const std::optional<std::string>& productFamily,
                                                    const SharedFacts& facts, bool oneShot = false,
                                                    const std::optional<double>& draw = std::nullopt);
  // Why a back end of this kind is not made, apart from shortages.
  static wire::Reason whyNotMade(std::string_view name);
  // Logs the lines that were held back. Called before the daemon ends.
  void sayRest() { _posts.sayRest(); }
  // Frees memory that is kept for the next message. Called when nothing was sent for a while.
  void rest() { _posts.rest(); }
  // Drops datagrams that outlive their sessions. `refuses`: whether a host may not be contacted.
  void dropWaiting(const std::function<bool(const std::string& host)>& refuses) {
    _dashboards->dropWaiting(refuses);
  }
  // The clients whose files wait for a place or are being compressed.
  FileUploads::Preparing preparingFiles() { return _files.preparing(); }

 private:
  std::shared_ptr<VeltraBackend> make(const std::string& name, const SharedProfile& profile,
                                      const std::optional<std::string>& productFamily,
                                      const SessionFacts& facts, bool oneShot,
                                      const std::optional<double>& draw);

  const BackendServices _services;
  EventPosts _posts;
  LogDataUploads _logData;
  const std::shared_ptr<DashboardQueues> _dashboards = std::make_shared<DashboardQueues>();
  FileUploads _files;
};

}  // namespace veltrad::backends
