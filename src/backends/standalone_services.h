// SPDX-License-Identifier: Apache-2.0
// The services of back ends over a machine that the caller provides: for tools that evaluate storebags, and
// for tests. The daemon has its own (daemon/services.h).
#pragma once

#include "backends/ampery/energy_log.h"
#include "backends/backend_factory.h"
#include "backends/dashboard/work_pool.h"
#include "backends/mivo/code_bundle.h"
#include "config/operator_settings.h"
#include "config/process_settings.h"
#include "platform/counters.h"
#include "platform/device_properties.h"
#include "platform/lent_files.h"
#include "platform/root.h"
#include "support/device_identity.h"
#include "support/veltra.h"

namespace veltrad::backends {

// All of it must outlive the services.
struct Machine {
  http::HTTPClient& http;
  platform::Clock& clock;
  platform::Random& random;
  platform::Locale& locale;
  platform::Preferences& preferences;
  platform::DeviceProperties& properties;
  platform::FileStore& files;
};

// In the order in which they need each other.
struct StandaloneServices {
  explicit StandaloneServices(const Machine& machine)
      : energyLog(machine.clock, counters, "/nowhere/energy.jsonl"),
        device(machine.properties),
        settings(machine.preferences, device, machine.files, root.deploymentPath()),
        choices(machine.files, root.settingsPath()),
        library(machine.files, machine.preferences, root),
        services{machine.http, machine.clock, machine.random, machine.locale, machine.preferences,
                 counters,     energyLog,     adaptorBundle,  settings,       choices,
                 device,       library,       pool,           lentFiles} {}

  platform::Counters counters;
  EnergyLog energyLog;
  CodeBundle adaptorBundle{"/nowhere", "none"};
  WorkPool pool;
  platform::LentFiles lentFiles;
  platform::Root root{"/"};
  support::DeviceIdentity device;
  config::ProcessSettings settings;
  config::OperatorSettings choices;
  support::Veltra library;
  const BackendServices services;
  BackendFactory factory{services};
};

}  // namespace veltrad::backends
