// SPDX-License-Identifier: Apache-2.0
// Selects the section of the process's environment from a storebag.
#include "config/storebag_section.h"

#include <iterator>
#include <utility>

#include "config/client_types.h"
#include "config/operator_settings.h"
#include "config/preference_keys.h"
#include "config/process_settings.h"
#include "config/storebag_content.h"
#include "config/storebag_store.h"
#include "config/storebag_trust.h"
#include "platform/counters.h"
#include "platform/log.h"

namespace veltrad::config {
namespace {

constexpr std::uint32_t kReleaseEnvironment = 4;

// Completes the answer with the section of the environment, if there is one. Returns the storebag for its
// other keys.
Storebag takeSection(const char* name, const Dictionary& whole, std::uint32_t environment,
                     StorebagSectionAnswer& answer) {
  auto storebag = parsed<Storebag>(whole);
  if (const Dictionary* section = sectionOf(storebag, environment)) {
    const bool standsIn = environment == kSeedEnvironment && !storebag.seed;
    answer.kind = StorebagAnswer::Kind::fetched;
    answer.section =
        parseSection(*section, {name, storebag.version,
                                sectionNameForEnvironment(standsIn ? kReleaseEnvironment : environment),
                                storebag.expires});
    answer.version = storebag.version;
  }
  return storebag;
}

StorebagSectionAnswer withoutName(std::int32_t clientType) {
  logError("fetchStorebagForEnvironmentAndClientType: Could not find storebag name for client type %d",
           clientType);
  StorebagSectionAnswer none;
  none.cause = StorebagCause::noName;
  none.why = "client type " + std::to_string(clientType) + " has no storebag";
  return none;
}

// The storebag has no section for the environment.
void sayMissing(std::int32_t clientType, std::uint32_t environment, StorebagSectionAnswer& answer) {
  const char* sectionName = sectionNameForEnvironment(environment);
  logError(
      "fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type %d with %s "
      "environment",
      clientType, sectionName != nullptr ? sectionName : "(null)");
  if (answer.cause != StorebagCause::none) return;
  answer.cause = StorebagCause::noSection;
  answer.why = sectionName ? "it has no section \"" + std::string(sectionName) + "\""
                           : "environment " + std::to_string(environment) + " names no section";
}
}  // namespace

const Dictionary* sectionOf(const Storebag& storebag, std::uint32_t environment) {
  const std::optional<Dictionary>* sections[] = {&storebag.development, &storebag.flornInternal,
                                                 &storebag.seed, &storebag.release};
  const std::uint32_t place = environment - 1;
  if (place >= std::size(sections)) return nullptr;
  if (environment == kSeedEnvironment && !storebag.seed) {
    logWarning("fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.");
    return sectionOf(storebag, kReleaseEnvironment);
  }
  return *sections[place] ? &**sections[place] : nullptr;
}

StorebagSections::StorebagSections(http::HTTPClient& http, ProcessSettings& settings,
                                   const support::Veltra& veltra, StorebagTrust& trust,
                                   OperatorSettings& choices, StorebagStore& store,
                                   platform::Counters& counters)
    : _settings(settings),
      _download(http, settings, veltra, trust),
      _trust(trust),
      _choices(choices),
      _store(store),
      _counters(counters) {}

StorebagSectionAnswer StorebagSections::fetchStorebagForEnvironmentAndClientType(
    std::int32_t clientType, const std::optional<std::string>& lastModified) {
  using Kind = StorebagAnswer::Kind;
  const char* name = storebagNameForClientType(clientType);
  if (name == nullptr) return withoutName(clientType);
  const auto choices = _choices.current();
  if (!choices) {
    refuse(clientType);
    StorebagSectionAnswer none;
    none.attempted = false;
    return none;
  }
  const bool persist = choices->storebags.persist;
  // A storebag that is to be kept must be downloaded completely once.
  const bool conditional = !persist || _store.holds(name);
  WholeStorebagAnswer whole =
      _download.fetchStorebagWithName(name, conditional ? lastModified : std::nullopt, *choices);
  StorebagSectionAnswer answer{whole, nullptr, {}};
  // A refused storebag is not stored, and may be accepted later, with another key or clock: the next request
  // is unconditional.
  if (answer.kind == Kind::failed && StorebagRules::of(*choices).any()) answer.lastModified = lastModified;
  if (answer.kind == Kind::failed && answer.attempted)
    logError("fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type %d",
             clientType);
  if (persist && answer.kind == Kind::notModified) _store.renew(name, answer.maxAge);
  if (answer.kind != Kind::fetched) return answer;
  answer.kind = Kind::failed;
  const std::optional<std::uint32_t> environment = _settings.currentEnvironment();
  if (!environment) {
    answer.attempted = false;
    answer.cause = StorebagCause::noAttempt;
    answer.why = "the environment cannot be read just now";
    return answer;
  }
  const Storebag storebag = takeSection(name, whole.storebag, *environment, answer);
  if (answer.kind != Kind::fetched) {
    sayMissing(clientType, *environment, answer);
    return answer;
  }
  if (storebag.refreshCycle) {
    answer.maxAge = static_cast<std::int32_t>(*storebag.refreshCycle);
    logInfo("fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge=%d", answer.maxAge);
  }
  if (persist && !whole.container.empty())
    _store.write(name, {std::move(whole.container), answer.lastModified, answer.maxAge});
  return answer;
}

KeptSection StorebagSections::keptStorebag(std::int32_t clientType) {
  KeptSection kept;
  const char* name = storebagNameForClientType(clientType);
  const auto choices = _choices.current();
  if (name == nullptr || !choices || !choices->storebags.persist) return kept;
  auto stored = _store.read(name);
  if (!stored) return kept;
  kept.known = !stored.value();
  if (kept.known) return kept;
  const auto whole = _trust.accepted(name, stored.value()->container, *choices);
  if (!whole) {
    const StorebagTrust::Refusal& refusal = whole.error();
    kept.known = refusal.cause != StorebagCause::noAttempt;
    const bool refused = refusal.cause == StorebagCause::refused;
    if (kept.known) _store.remove(name, refused ? refusal.why : "its signature cannot be verified");
    return kept;
  }
  const std::optional<std::uint32_t> environment = _settings.currentEnvironment();
  if (!environment) return kept;
  kept.known = true;
  takeSection(name, whole.value(), *environment, kept.answer);
  if (kept.answer.kind != StorebagAnswer::Kind::fetched) return kept;
  kept.answer.maxAge = stored.value()->maxAge;
  kept.answer.lastModified = std::move(stored.value()->lastModified);
  kept.fetchTime = stored.value()->fetchTime;
  return kept;
}

std::optional<std::string> StorebagSections::whyNotUsed(const StorebagSection& section) {
  if (!section.origin.expires) return std::nullopt;
  const auto choices = _choices.current();
  return choices && choices->storebags.expiry ? _trust.whyExpired(section.origin.expires) : std::nullopt;
}

double StorebagSections::jitter() {
  const auto choices = _choices.current();
  return choices ? *choices->jitter : 0;
}

// Clients can trigger this line, so it is limited.
void StorebagSections::refuse(std::int32_t clientType) {
  _counters.count(wire::Reason::settings_broken);
  const auto line = _refusals.happened(
      "fetchStorebagForEnvironmentAndClientType: No storebag is accepted for client type " +
      std::to_string(clientType) + " until the settings can be read");
  if (line) logError("%s", line->c_str());
}

}  // namespace veltrad::config
