// Makes backends by name. Any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "backends/backend.h"
#include "backends/dashboard/dashboard_queues.h"
#include "backends/dashboard/log_data_uploads.h"
#include "backends/https/event_posts.h"
#include "backends/upload/file_uploads.h"
#include "config/storebag_content.h"

namespace veltrad::config {
class ProcessSettings;
}  // namespace veltrad::config

namespace veltrad::http {
class HTTPClient;
}  // namespace veltrad::http

namespace veltrad::platform {
class Clock;
class Counters;
class LentFiles;
class Locale;
class Preferences;
class Random;
}  // namespace veltrad::platform

namespace veltrad::support {
class DeviceIdentity;
class Veltra;
}  // namespace veltrad::support

namespace veltrad::backends {

class CodeBundle;
class EnergyLog;
class SamplingFactors;
class WorkPool;

// What the factory passes on: each kind of backend takes its own few. Everything outlives the backends. Its
// 15 fields are what all kinds together use.
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
  support::DeviceIdentity& device;
  const support::Veltra& library;
  WorkPool& pool;
  platform::LentFiles& lentFiles;
  std::string scratchDirectory = "/tmp";  // for files without a name
  SamplingFactors* sampling = nullptr;    // null: every sampling factor is drawn
};

// Null: its back end reads nothing of it.
using SharedProfile = std::shared_ptr<const config::Profile>;

class BackendFactory {
 public:
  explicit BackendFactory(BackendServices services)
      : _services(services),
        _posts(services.http, services.clock, services.counters),
        _logData(services.http, services.counters) {}
  // Null: no such backend here, or it cannot work with this profile; one line has said so. `profile` as the
  // section of a storebag has it under the name.
  std::shared_ptr<VeltraBackend> newBackendWithName(const std::string& name, const SharedProfile& profile,
                                                    const std::optional<std::string>& productFamily,
                                                    std::int32_t clientType, const BackendOwner& owner = {});
  // The lines that were held back: before the daemon ends.
  void sayRest() { _posts.sayRest(); }

 private:
  const BackendServices _services;
  EventPosts _posts;
  LogDataUploads _logData;
  const std::shared_ptr<DashboardQueues> _dashboards = std::make_shared<DashboardQueues>();
  FileUploads _files;
};

}  // namespace veltrad::backends
