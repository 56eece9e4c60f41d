// SPDX-License-Identifier: Apache-2.0
// The root directory, and the system's fixed paths under it.
#pragma once

#include <string>
#include <string_view>

#include "wire/socket_path.h"

namespace veltrad::platform {

class Root {
 public:
  explicit Root(std::string directory = "/");
  // VELTRA_ROOT, or "/" if it is unset or empty.
  static Root fromEnvironment() { return Root(wire::rootFromEnvironment()); }

  const std::string& directory() const { return _directory; }
  // `relative` without a leading slash: path("etc/veltrad/ca.pem").
  std::string path(std::string_view relative) const { return wire::pathUnder(_directory, relative); }

  std::string runDirectory() const { return path("run/veltrad"); }
  std::string socketPath() const { return wire::socketPathUnder(_directory); }
  // The socket for administration programs.
  std::string controlSocketPath() const { return wire::controlSocketPathUnder(_directory); }
  std::string lockPath() const { return path("run/veltrad/lock"); }
  // The counts of this daemon, for the next one if this one is killed.
  std::string countsPath() const { return path("run/veltrad/counts"); }
  std::string countersPath() const { return path("run/veltrad/counters.json"); }
  std::string stateDirectory() const { return path("var/lib/veltrad"); }
  std::string allowancePath() const { return path("var/lib/veltrad/daily.json"); }
  std::string destinationsPath() const { return path("var/lib/veltrad/destinations.json"); }
  std::string historyDirectory() const { return path("var/lib/veltrad/history"); }
  std::string spoolDirectory() const { return path("var/lib/veltrad/spool"); }
  std::string secretPath() const { return path("var/lib/veltrad/secret"); }
  // Storebags that survive a restart, a file a name.
  std::string storebagsDirectory() const { return path("var/lib/veltrad/storebags"); }
  // Serials and revocations of storebags.
  std::string seenStorebagsPath() const { return path("var/lib/veltrad/seen-storebags.json"); }
  std::string metricsPath() const { return path("run/veltrad/metrics.prom"); }
  std::string preferencesDirectory() const { return path("var/lib/veltrad/preferences"); }
  std::string logsDirectory() const { return path("var/log/veltrad"); }
  std::string energyLogPath() const { return path("var/log/veltrad/energy.jsonl"); }
  // The parent of the diagnostic message log's directory is made at start, the directory by the first
  // message.
  std::string messageLogDirectory() const { return path("var/mobile/Library/Logs/Zentrel/Retired"); }
  std::string configurationDirectory() const { return path("etc/veltrad"); }
  std::string entitlementsPath() const { return path("etc/veltrad/entitlements.plist"); }
  std::string devicePath() const { return path("etc/veltrad/device.plist"); }
  std::string deploymentPath() const { return path("etc/veltrad/deployment.plist"); }
  std::string settingsPath() const { return path("etc/veltrad/settings.json"); }
  std::string policyPath() const { return path("etc/veltrad/policy.json"); }
  // Further public keys of storebags.
  std::string keysDirectory() const { return path("etc/veltrad/keys"); }
  std::string extraCertificatesPath() const { return path("etc/veltrad/ca.pem"); }
  std::string localeConfigurationPath() const { return path("etc/locale.conf"); }
  std::string resourcesDirectory() const { return path("usr/share/veltra"); }
  std::string adaptorBundleDirectory() const {
    return path(
        "System/Library/PrivateFrameworks/PellmarchServices.framework/Frameworks/"
        "PellmarchPerformance.framework");
  }
  std::string publicKeyPath() const { return path("usr/share/veltra/publicKey.der"); }
  std::string packageManifestPath() const { return path("usr/share/veltra/package.plist"); }

 private:
  std::string _directory;
};

}  // namespace veltrad::platform
