// SPDX-License-Identifier: Apache-2.0
// The daemon's services, made once by main and passed to the rooms by reference.
#pragma once

#include "backends/ampery/energy_log.h"
#include "backends/dashboard/work_pool.h"
#include "backends/mivo/code_bundle.h"
#include "config/destinations.h"
#include "config/owner_gate.h"
#include "config/owner_policy.h"
#include "http/http_client.h"
#include "ipc/entitlements.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/device_properties.h"
#include "platform/device_secret.h"
#include "platform/disk_writer.h"
#include "platform/file_store.h"
#include "platform/lent_files.h"
#include "platform/locale.h"
#include "platform/memory_budget.h"
#include "platform/preferences.h"
#include "platform/random.h"
#include "platform/root.h"
#include "platform/service_manager.h"
#include "platform/transaction.h"
#include "support/history.h"

namespace veltrad::daemon {

// Its 25 fields are the services of the whole process.
struct Services {
  explicit Services(platform::Root where)
      : root(std::move(where)),
        preferences(files, root.preferencesDirectory()),
        device(files, root.devicePath()),
        locale(files, root.localeConfigurationPath()),
        entitlements(files, root.entitlementsPath()),
        transaction(serviceManager),
        energyLog(clock, counters, root.energyLogPath()),
        adaptorBundle(root.adaptorBundleDirectory(), "PellmarchPerformance"),
        secret(files, root.secretPath()),
        policy(files, root.policyPath()),
        allowance(files, clock, root.allowancePath()),
        destinations(files, clock, root.destinationsPath()),
        history(clock, root.historyDirectory(), writer),
        gate(policy, preferences, secret, allowance, &destinations, &history),
        http({root.extraCertificatesPath(), &gate}) {
    device.heedReset(preferences, secret);
  }

  const platform::Root root;
  platform::MemoryBudget memory;
  // For the control socket, so that clients that use much memory do not lock out administrators.
  platform::MemoryBudget observersMemory{{16u << 20, 8u << 20, 4u << 20, 32u << 20, 16u << 20}};
  platform::SystemClock clock;
  platform::UnseededSequence random;
  platform::DiskFileStore files;
  platform::FilePreferences preferences;
  platform::MachineProperties device;
  platform::EnvironmentLocale locale;
  ipc::Entitlements entitlements;
  platform::ServiceManager serviceManager;
  platform::ServiceTransaction transaction;
  platform::Counters counters;
  backends::EnergyLog energyLog;
  backends::CodeBundle adaptorBundle;
  platform::DeviceSecret secret;
  config::OwnerPolicy policy;
  config::DailyAllowance allowance;
  config::Destinations destinations;
  platform::DiskWriter writer;
  support::History history;
  config::OwnerGate gate;
  http::CurlHTTPClient http;
  backends::WorkPool pool;
  platform::LentFiles lentFiles;
};

}  // namespace veltrad::daemon
