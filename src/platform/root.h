// The directory under which every fixed path of the system lies. Any thread; constant after construction.
#pragma once

#include <string>
#include <string_view>

namespace veltrad::platform {

class Root {
 public:
  // `directory` is absolute or relative to the working directory; "/" by default.
  explicit Root(std::string directory = "/");
  // VELTRA_ROOT, or "/" where it is unset or empty.
  static Root fromEnvironment();

  const std::string& directory() const { return _directory; }
  // `relative` without a leading slash: path("etc/veltrad/ca.pem").
  std::string path(std::string_view relative) const;

  std::string runDirectory() const { return path("run/veltrad"); }
  std::string socketPath() const;
  // Where those who look after the device ask; beside the service's socket.
  std::string controlSocketPath() const;
  std::string lockPath() const { return path("run/veltrad/lock"); }
  std::string countersPath() const { return path("run/veltrad/counters.json"); }
  std::string stateDirectory() const { return path("var/lib/veltrad"); }
  std::string secretPath() const { return path("var/lib/veltrad/secret"); }
  // Storebags that survive a restart, a file a name.
  std::string storebagsDirectory() const { return path("var/lib/veltrad/storebags"); }
  std::string metricsPath() const { return path("run/veltrad/metrics.prom"); }
  std::string preferencesDirectory() const { return path("var/lib/veltrad/preferences"); }
  std::string logsDirectory() const { return path("var/log/veltrad"); }
  std::string energyLogPath() const { return path("var/log/veltrad/energy.jsonl"); }
  // The diagnostic message log's own directory; its parent is made at start, itself by the first message.
  std::string messageLogDirectory() const { return path("var/mobile/Library/Logs/Zentrel/Retired"); }
  std::string configurationDirectory() const { return path("etc/veltrad"); }
  std::string entitlementsPath() const { return path("etc/veltrad/entitlements.plist"); }
  std::string devicePath() const { return path("etc/veltrad/device.plist"); }
  std::string deploymentPath() const { return path("etc/veltrad/deployment.plist"); }
  std::string settingsPath() const { return path("etc/veltrad/settings.json"); }
  std::string extraCertificatesPath() const { return path("etc/veltrad/ca.pem"); }
  std::string localeConfigurationPath() const { return path("etc/locale.conf"); }
  std::string resourcesDirectory() const { return path("usr/share/veltra"); }
  // Where the adaptor bundle is looked for.
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
