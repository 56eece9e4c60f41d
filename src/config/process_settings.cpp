// SPDX-License-Identifier: Apache-2.0
// Computes the settings of the process from preferences, the device and deployment.plist.
#include "config/process_settings.h"

#include <algorithm>
#include <utility>

#include "config/preference_keys.h"
#include "platform/log.h"
#include "platform/preferences.h"
#include "support/device_identity.h"

namespace veltrad::config {
namespace {

constexpr const char* kInternalStorebagHost = "storebags.internal.example";
constexpr const char* kPublicStorebagHost = "storebags.example";

// A name or an address with an optional port; excludes all other characters of URLs.
bool looksLikeHost(const std::string& text) {
  return !text.empty() && std::all_of(text.begin(), text.end(), [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '.' ||
           c == '-' || c == '_' || c == ':' || c == '[' || c == ']';
  });
}

}  // namespace

bool isExampleStorebagURL(std::string_view url) {
  constexpr std::string_view kScheme = "https://";
  if (!url.starts_with(kScheme)) return false;
  url.remove_prefix(kScheme.size());
  const std::string_view host = url.substr(0, url.find_first_of("/:"));
  return host == kInternalStorebagHost || host == kPublicStorebagHost;
}

ProcessSettings::ProcessSettings(platform::Preferences& preferences, support::DeviceIdentity& device,
                                 platform::FileStore& files, const std::string& deploymentPath)
    : _preferences(preferences), _device(device), _deployment(files, deploymentPath) {}

std::optional<std::uint32_t> ProcessSettings::currentEnvironment() {
  {
    const Lock held(_mutex);
    if (_environment) return _environment;
  }
  const std::optional<Environment> found = userDefaultsEnvironment();
  if (!found) return std::nullopt;
  {
    const Lock held(_mutex);
    if (_environment) return _environment;
    _environment = found->type;
  }
  if (found->refused) logError("userDefaultsEnvironment: Invalid environment type %u", *found->refused);
  logInfo("userDefaultsEnvironment: Environment type %u", found->type);
  return found->type;
}

std::optional<ProcessSettings::Environment> ProcessSettings::userDefaultsEnvironment() {
  const auto preference =
      _preferences.lookUp(platform::kVeltraPreferenceDomain, preference::kEnvironmentType);
  if (!preference) return std::nullopt;
  const auto stored = preference.value() ? preference.value()->toUInt32() : std::nullopt;
  if (stored && *stored >= kEnvironmentCount) return Environment{kInternalEnvironment, stored};
  if (stored) return Environment{*stored, std::nullopt};
  const std::optional<bool> internal = _device.internalBuild();
  if (!internal) return std::nullopt;
  return Environment{*internal ? kInternalEnvironment : kSeedEnvironment, std::nullopt};
}

std::optional<std::string> ProcessSettings::storebagServerURL() {
  bool preferred = true;
  {
    const Lock held(_mutex);
    if (_storebagServerURL) return _storebagServerURL;
    preferred = !_fromDeployment;
  }
  std::optional<std::string> found;
  if (preferred) {
    const auto preference = _preferences.lookUp(platform::kVeltraPreferenceDomain, preference::kStorebagURL);
    if (!preference) return std::nullopt;
    found = preference.value() ? preference.value()->toText() : std::nullopt;
  }
  const bool fromDeployment = !found;
  if (fromDeployment) found = deployedStorebagServerURL();
  const Lock held(_mutex);
  if (!_storebagServerURL && found) {
    _fromDeployment = fromDeployment;
    _storebagServerURL = std::move(found);
  }
  return _storebagServerURL;
}

void ProcessSettings::readDeploymentAgain() {
  using Kind = platform::LocalContent::Kind;
  std::shared_ptr<const platform::LocalContent> broken;
  {
    const Lock held(_mutex);
    if (!_fromDeployment) return;
    _deployment.readAgain();
    const auto now = _deployment.content();
    if (!now) return;
    if (now.value()->kind == Kind::broken) {
      broken = now.value();
    } else {
      _storebagServerURL.reset();
    }
  }
  if (broken) {
    logWarning("storebagServerURL: %s; the address stays as it is", broken->error.c_str());
  } else {
    static_cast<void>(storebagServerURL());
  }
}

std::optional<std::string> ProcessSettings::deployedStorebagServerURL() {
  const std::optional<bool> internal = _device.internalBuild();
  const auto host = internal ? storebagHost(*internal) : std::nullopt;
  if (!host) return std::nullopt;
  return "https://" + *host + (*internal ? "/storebags/maple" : "/bags/maple");
}

std::optional<std::string> ProcessSettings::storebagHost(bool internalBuild) {
  const char* builtIn = internalBuild ? kInternalStorebagHost : kPublicStorebagHost;
  const char* key = internalBuild ? "internalStorebagHost" : "publicStorebagHost";
  std::shared_ptr<const platform::LocalContent> deployment;
  {
    const Lock held(_mutex);
    auto now = _deployment.content();
    if (!now) return std::nullopt;
    deployment = std::move(now).value();
  }
  if (deployment->warning) logWarning("storebagServerURL: %s", deployment->warning->c_str());
  using Kind = platform::LocalContent::Kind;
  if (deployment->kind == Kind::absent) return builtIn;
  const Dictionary* hosts = deployment->kind == Kind::good ? deployment->value.asDictionary() : nullptr;
  if (hosts == nullptr) {
    complain(
        deployment->kind == Kind::broken ? deployment->error : deployment->placeOf({}) + ": not a dictionary",
        "the built-in hosts");
    return builtIn;
  }
  const std::string* host = hosts->string(key);
  if (host == nullptr) return builtIn;
  if (!looksLikeHost(*host)) {
    complain(deployment->placeOf({key}) + ": " + key + " is \"" + *host + "\", expected a host name",
             builtIn);
    return builtIn;
  }
  return *host;
}

void ProcessSettings::complain(std::string problem, const char* hosts) {
  logWarning("storebagServerURL: %s; using %s", problem.c_str(), hosts);
  const Lock held(_mutex);
  _deploymentProblem = std::move(problem);
}

std::string ProcessSettings::deploymentProblem() {
  const Lock held(_mutex);
  return _deploymentProblem;
}

}  // namespace veltrad::config
