// SPDX-License-Identifier: Apache-2.0
// Every service's twin in one place, and the real objects that stand on them, for tests of back ends and
// above.
#pragma once

#include "backends/ampery/energy_log.h"
#include "backends/backend_factory.h"
#include "backends/dashboard/work_pool.h"
#include "backends/mivo/code_bundle.h"
#include "config/operator_settings.h"
#include "config/process_settings.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_http_client.h"
#include "fakes/machine.h"
#include "platform/counters.h"
#include "platform/lent_files.h"
#include "platform/root.h"
#include "support/device_identity.h"
#include "support/veltra.h"

namespace veltrad {

// Its 19 fields are the services in the order in which they need each other.
struct World {
  FakeHTTPClient http;
  FakeClock clock;
  FakeRandom random;
  FakeLocale locale;
  FakePreferences preferences;
  FakeDeviceProperties properties;
  FakeFileStore files;
  platform::Counters counters;
  backends::EnergyLog energyLog{clock, counters, "/nowhere/energy.jsonl"};
  backends::CodeBundle adaptorBundle{"/nowhere", "none"};
  backends::WorkPool pool;
  platform::LentFiles lentFiles;
  platform::Root root{"/"};
  support::DeviceIdentity device{properties};
  config::ProcessSettings settings{preferences, device, files, root.deploymentPath()};
  config::OperatorSettings choices{files, root.settingsPath()};
  support::Veltra library{files, preferences, root};
  const backends::BackendServices services{http,     clock,     random,        locale,   preferences,
                                           counters, energyLog, adaptorBundle, settings, choices,
                                           device,   library,   pool,          lentFiles};
  backends::BackendFactory factory{services};
};

}  // namespace veltrad
