// Every service's twin in one place, and the real objects that stand on them, for tests of back ends and
// above.
#pragma once

#include "backends/backend_factory.h"
#include "config/process_settings.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_http_client.h"
#include "fakes/machine.h"
#include "platform/code_bundle.h"
#include "platform/counters.h"
#include "platform/energy_log.h"
#include "platform/lent_files.h"
#include "platform/root.h"
#include "platform/work_pool.h"
#include "protocol/veltra.h"
#include "support/device_identity.h"

namespace veltrad {

struct World {
  FakeHTTPClient http;
  FakeClock clock;
  FakeRandom random;
  FakeLocale locale;
  MemoryPreferences preferences;
  FakeDeviceProperties properties;
  FakeFileStore files;
  platform::Counters counters;
  platform::EnergyLog energyLog{clock, counters, "/nowhere/energy.jsonl"};
  platform::CodeBundle adaptorBundle{"/nowhere", "none"};
  platform::WorkPool pool;
  platform::LentFiles lentFiles;
  platform::Root root{"/"};
  DeviceIdentity device{properties};
  ProcessSettings settings{preferences, device, files, root.deploymentPath()};
  Veltra library{files, preferences, root};
  const BackendServices services{http,          clock,    random, locale,  preferences, counters, energyLog,
                                 adaptorBundle, settings, device, library, pool,        lentFiles};
  StandardBackendFactory factory{services};
};

}  // namespace veltrad
