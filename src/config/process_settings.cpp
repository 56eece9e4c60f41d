// The settings that hold for the life of the process: where they come from and what stands in for them. Any
// thread.
#include "config/process_settings.h"

#include <algorithm>
#include <utility>

#include "formats/property_list.h"
#include "platform/file_store.h"
#include "platform/log.h"
#include "platform/preferences.h"
#include "support/device_identity.h"

namespace veltrad::config {
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

// Empty where there is none to go by, and then `problem` says why if the file is there; nothing: it cannot be
// read just now.
std::optional<Dictionary> readDeployment(platform::FileStore& files, const std::string& path,
                                         std::string& problem) {
  const auto bytes = files.read(path);
  if (!bytes) {
    if (bytes.error().passes()) return std::nullopt;
    if (bytes.error().kind != platform::FileFailure::Kind::notFound) problem = bytes.error().description;
    return Dictionary();
  }
  const auto list = formats::parsePropertyList(bytes.value());
  const Dictionary* dictionary = list ? list.value().asDictionary() : nullptr;
  if (dictionary != nullptr) return *dictionary;
  problem = path + ": " + (list ? "not a dictionary" : list.error().detail);
  return Dictionary();
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
                                 platform::FileStore& files, std::string deploymentPath)
    : _preferences(preferences), _device(device), _files(files), _deploymentPath(std::move(deploymentPath)) {}

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
  const auto preference = _preferences.lookUp(platform::kVeltraPreferenceDomain, "environmentType");
  if (!preference) return std::nullopt;
  const auto stored = preference.value() ? preference.value()->toUInt32() : std::nullopt;
  if (stored && *stored >= kEnvironmentCount) return Environment{kInternalEnvironment, stored};
  if (stored) return Environment{*stored, std::nullopt};
  const std::optional<bool> internal = _device.internalBuild();
  if (!internal) return std::nullopt;
  return Environment{*internal ? kInternalEnvironment : kSeedEnvironment, std::nullopt};
}

std::optional<std::string> ProcessSettings::storebagServerURL() {
  {
    const Lock held(_mutex);
    if (_storebagServerURL) return _storebagServerURL;
  }
  auto found = computeStorebagServerURL();
  const Lock held(_mutex);
  if (!_storebagServerURL) _storebagServerURL = std::move(found);
  return _storebagServerURL;
}

std::optional<std::string> ProcessSettings::computeStorebagServerURL() {
  const auto preference = _preferences.lookUp(platform::kVeltraPreferenceDomain, "veltra_storebag_url");
  if (!preference) return std::nullopt;
  if (const auto url = preference.value() ? preference.value()->toText() : std::nullopt) return url;
  const std::optional<bool> internal = _device.internalBuild();
  const auto host = internal ? storebagHost(*internal) : std::nullopt;
  if (!host) return std::nullopt;
  return "https://" + *host + (*internal ? "/storebags/maple" : "/bags/maple");
}

bool ProcessSettings::isInternalBuild() {
  return _device.isInternalBuild();
}

std::optional<std::string> ProcessSettings::storebagHost(bool internalBuild) {
  const char* builtIn = internalBuild ? kInternalStorebagHost : kPublicStorebagHost;
  const char* key = internalBuild ? "internalStorebagHost" : "publicStorebagHost";
  std::string problem;
  const std::optional<Dictionary> deployment = readDeployment(_files, _deploymentPath, problem);
  if (!deployment) return std::nullopt;
  if (!problem.empty()) complain(std::move(problem), "the built-in hosts");
  const std::string* host = deployment->string(key);
  if (host == nullptr) return builtIn;
  if (!looksLikeHost(*host)) {
    complain(_deploymentPath + ": " + key + " is \"" + *host + "\", expected a host name", builtIn);
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
