// The real services, built once by a program's main and handed on by reference, a few to each room.
#pragma once

#include "platform/clock.h"
#include "platform/code_bundle.h"
#include "platform/counters.h"
#include "platform/device_properties.h"
#include "platform/disk_writer.h"
#include "platform/energy_log.h"
#include "platform/entitlements.h"
#include "platform/file_store.h"
#include "platform/http_client.h"
#include "platform/lent_files.h"
#include "platform/locale.h"
#include "platform/memory_budget.h"
#include "platform/preferences.h"
#include "platform/random.h"
#include "platform/root.h"
#include "platform/service_manager.h"
#include "platform/transaction.h"
#include "platform/work_pool.h"

namespace veltrad::platform {

struct Services {
  explicit Services(Root where)
      : root(std::move(where)),
        preferences(files, root.preferencesDirectory()),
        device(files, root.devicePath()),
        locale(files, root.localeConfigurationPath()),
        entitlements(files, root.entitlementsPath()),
        transaction(serviceManager),
        energyLog(clock, counters, root.energyLogPath()),
        adaptorBundle(root.adaptorBundleDirectory(), "PellmarchPerformance"),
        http({root.extraCertificatesPath()}) {}

  const Root root;
  MemoryBudget memory;
  SystemClock clock;
  UnseededSequence random;
  DiskFileStore files;
  FilePreferences preferences;
  MachineProperties device;
  EnvironmentLocale locale;
  Entitlements entitlements;
  ServiceManager serviceManager;
  ServiceTransaction transaction;
  Counters counters;
  EnergyLog energyLog;
  CodeBundle adaptorBundle;
  CurlHTTPClient http;
  WorkPool pool;
  LentFiles lentFiles;
  DiskWriter writer;
};

}  // namespace veltrad::platform
