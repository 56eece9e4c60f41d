// SPDX-License-Identifier: Apache-2.0
// Collects each fact from its source.
#include "daemon/doctor.h"

#include <sys/resource.h>
#include <unistd.h>

#include <map>

#include "base/version.h"
#include "config/client_types.h"
#include "config/preference_keys.h"
#include "config/process_settings.h"
#include "daemon/storebag_cache.h"
#include "http/http_queue.h"
#include "ipc/connection.h"
#include "wire/constants.h"

namespace veltrad::daemon {

namespace {

// A socket and a wake-up descriptor for each of 4,096 clients and 64 observers; a socket for each post under
// way and for each of 256 dashboards; 64 for files, the log, certificates and the libraries.
constexpr std::uint64_t kDescriptorsNeeded = 2ULL * (4'096 + 64) + http::HTTPQueue::kMostEvents + 256 + 64;

struct Names {
  std::map<std::string, std::int32_t> types;  // one client type for each name
  std::vector<std::int32_t> typesWithout;
  bool needed = true;
};

Names namesOfTypes(const std::vector<std::int32_t>& types) {
  Names names;
  for (const std::int32_t type : types) {
    if (const char* name = config::storebagNameForClientType(type)) {
      names.types.try_emplace(name, type);
    } else {
      names.typesWithout.push_back(type);
    }
  }
  return names;
}

Names namesInUse(const std::map<std::string, StorebagRecord>& records) {
  std::vector<std::int32_t> all;
  std::vector<std::int32_t> used;
  for (std::int32_t type = 0; type < config::kVeltraClientTypeCount; ++type) {
    const char* name = config::storebagNameForClientType(type);
    if (!name) continue;
    all.push_back(type);
    if (records.contains(name)) used.push_back(type);
  }
  Names names = namesOfTypes(used.empty() ? all : used);
  names.needed = !used.empty();
  return names;
}

}  // namespace

Doctor::Doctor(Services& services, config::ProcessSettings& settings, config::StorebagSource& source,
               platform::SandboxState sandbox)
    : _services(services), _settings(settings), _source(source), _sandbox(std::move(sandbox)) {}

Dictionary Doctor::examine(ipc::Connection& caller, StorebagCache& cache,
                           const std::vector<std::int32_t>& types) {
  Array checks;
  for (Check& check : diagnose(entitlementOf(caller), address(), storebags(cache, types), machine())) {
    checks.push_back(Dictionary{{"name", check.name},
                                {"result", nameOf(check.result)},
                                {"text", std::move(check.text)},
                                {"mend", std::move(check.mend)}});
  }
  return {{"version", kVersion}, {"pid", static_cast<int>(::getpid())}, {"checks", std::move(checks)}};
}

EntitlementFacts Doctor::entitlementOf(ipc::Connection& caller) {
  const auto value = caller.valueForEntitlement(wire::kVeltraEntitlement);
  return {_services.entitlements.stateFor(wire::kVeltraEntitlement), _services.root.entitlementsPath(),
          caller.uid(), value && value->isBoolean() && *value->toBoolean()};
}

AddressFacts Doctor::address() {
  auto inUse = _settings.storebagServerURL();
  return {std::move(inUse),
          _services.preferences.text(platform::kVeltraPreferenceDomain, config::preference::kStorebagURL),
          _services.root.deploymentPath(), _settings.deploymentProblem()};
}

StorebagFacts Doctor::storebags(StorebagCache& cache, const std::vector<std::int32_t>& types) {
  const auto records = cache.records();
  Names names = types.empty() ? namesInUse(records) : namesOfTypes(types);
  StorebagFacts facts;
  facts.needed = names.needed;
  facts.section = config::sectionNameForEnvironment(_settings.currentEnvironment().value_or(0));
  facts.certificatesPath = _services.root.extraCertificatesPath();
  facts.publicKeyPath = _services.root.publicKeyPath();
  facts.places = {_services.root.keysDirectory(), _services.root.settingsPath(),
                  _services.root.seenStorebagsPath()};
  facts.typesWithout = std::move(names.typesWithout);
  const auto url = _settings.storebagServerURL();
  if (!url || config::isExampleStorebagURL(*url)) return facts;
  for (const auto& [name, type] : names.types) {
    auto answer = _source.fetchStorebagForEnvironmentAndClientType(type, std::nullopt);
    const auto record = records.find(name);
    const bool emptyRecord =
        record != records.end() && record->second.fetchSuccessful && !record->second.data;
    facts.findings.push_back({name, answer, std::move(answer.version), emptyRecord});
    if (endsAtServer(answer.cause)) break;
  }
  return facts;
}

Consent Doctor::consent() {
  const auto refusal = _services.gate.decision()->refusal;
  if (refusal == wire::Reason::policy_broken) return Consent::policyBroken;
  if (refusal == wire::Reason::policy_reporting || refusal == wire::Reason::privacy_off)
    return Consent::reportingOff;
  const auto stored =
      _services.preferences.lookUp(platform::kVeltraPreferenceDomain, config::preference::kConsent);
  if (!stored) return Consent::notKnown;
  if (!stored.value()) return Consent::neverGiven;
  const auto given = stored.value()->toBoolean();
  if (!given) return Consent::noBoolean;
  return *given ? Consent::given : Consent::refused;
}

MachineFacts Doctor::machine() {
  const std::string directory = _services.root.messageLogDirectory();
  const auto tried = platform::tryWritingIn(directory);
  rlimit limit{};
  ::getrlimit(RLIMIT_NOFILE, &limit);
  return {consent(),
          directory,
          tried ? std::string() : tried.error().description,
          _sandbox.inForce,
          _sandbox.line,
          limit.rlim_cur,
          kDescriptorsNeeded,
          platform::timevalToSeconds(_services.clock.now())};
}

}  // namespace veltrad::daemon
