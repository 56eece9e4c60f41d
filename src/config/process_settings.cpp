// The settings that hold for the life of the process: where they come from and what stands in for them. Any
// thread.
#include "config/process_settings.h"

#include <algorithm>
#include <utility>

#include "base/property_list.h"
#include "platform/file_store.h"
#include "platform/log.h"
#include "platform/preferences.h"
#include "support/device_identity.h"

namespace veltrad {
namespace {

constexpr std::uint32_t kEnvironmentCount = 5;
constexpr std::uint32_t kInternalEnvironment = 2;
constexpr std::uint32_t kSeedEnvironment = 3;

constexpr const char* kInternalStorebagHost = "storebags.internal.example";
constexpr const char* kPublicStorebagHost = "storebags.example";

// A name or an address, with a port or without; what else a URL may hold has no place in a host.
bool looksLikeHost(const std::string& text) {
  return !text.empty() && std::all_of(text.begin(), text.end(), [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' ||
           c == '-' || c == '_' || c == ':' || c == '[' || c == ']';
  });
}

std::optional<Dictionary> readDeployment(platform::FileStore& files, const std::string& path) {
  const auto bytes = files.read(path);
  if (!bytes) {
    if (bytes.error().kind != platform::FileFailure::Kind::notFound)
      logWarning("storebagServerURL: %s; using the built-in hosts", bytes.error().description.c_str());
    return std::nullopt;
  }
  const auto list = parsePropertyList(bytes.value());
  const Dictionary* dictionary = list ? list.value().asDictionary() : nullptr;
  if (dictionary == nullptr) {
    logWarning("storebagServerURL: %s: %s; using the built-in hosts", path.c_str(),
               list ? "not a dictionary" : list.error().detail.c_str());
    return std::nullopt;
  }
  return *dictionary;
}

}  // namespace

ProcessSettings::ProcessSettings(platform::Preferences& preferences, DeviceIdentity& device,
                                 platform::FileStore& files, std::string deploymentPath)
    : _preferences(preferences), _device(device), _files(files), _deploymentPath(std::move(deploymentPath)) {}

std::uint32_t ProcessSettings::currentEnvironment() {
  std::call_once(_environmentOnce, [this] { _environment = userDefaultsEnvironment(); });
  return _environment;
}

std::uint32_t ProcessSettings::userDefaultsEnvironment() {
  const std::optional<Value> preference =
      _preferences.value(platform::kVeltraPreferenceDomain, "environmentType");
  const std::optional<std::uint32_t> stored = preference ? preference->toUInt32() : std::nullopt;
  std::uint32_t environment = stored.value_or(isInternalBuild() ? kInternalEnvironment : kSeedEnvironment);
  if (environment >= kEnvironmentCount) {
    logError("userDefaultsEnvironment: Invalid environment type %u", environment);
    environment = kInternalEnvironment;
  }
  logInfo("userDefaultsEnvironment: Environment type %u", environment);
  return environment;
}

std::string ProcessSettings::storebagServerURL() {
  std::call_once(_storebagServerURLOnce, [this] {
    const auto preference = _preferences.text(platform::kVeltraPreferenceDomain, "veltra_storebag_url");
    const bool internal = isInternalBuild();
    _storebagServerURL =
        preference ? *preference
                   : "https://" + storebagHost(internal) + (internal ? "/storebags/maple" : "/bags/maple");
  });
  return _storebagServerURL;
}

bool ProcessSettings::isInternalBuild() {
  return _device.isInternalBuild();
}

std::string ProcessSettings::storebagHost(bool internalBuild) {
  const char* builtIn = internalBuild ? kInternalStorebagHost : kPublicStorebagHost;
  const char* key = internalBuild ? "internalStorebagHost" : "publicStorebagHost";
  const std::optional<Dictionary> deployment = readDeployment(_files, _deploymentPath);
  const std::string* host = deployment ? deployment->string(key) : nullptr;
  if (host == nullptr) return builtIn;
  if (!looksLikeHost(*host)) {
    logWarning("storebagServerURL: %s: %s is \"%s\", expected a host name; using %s", _deploymentPath.c_str(),
               key, host->c_str(), builtIn);
    return builtIn;
  }
  return *host;
}

}  // namespace veltrad
