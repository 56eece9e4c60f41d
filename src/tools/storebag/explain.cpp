// SPDX-License-Identifier: Apache-2.0
// Explains each back end by a dry run.
#include <algorithm>

#include "backends/dashboard/packet_text.h"
#include "backends/dashboard/udp_socket.h"
#include "backends/https/https_post_backend.h"
#include "base/null_value.h"
#include "config/client_types.h"
#include "config/storebag_section.h"
#include "storebag/dry_run.h"
#include "storebag/explanation.h"
#include "storebag/silence.h"
#include "wire/constants.h"

namespace veltrad::storebag {
namespace {

using backends::SharedProfile;
using config::ClientEntry;
using wire::Reason;

constexpr std::uint32_t kReleaseEnvironment = 4;

// Each run has its own.
constexpr const char* kFactsOfARun[] = {"_startTS",   "_clientTS",       "eventTime",
                                        "_sessionID", "_timezoneOffset", "_reportVers"};

bool isContainer(const Value& value) {
  return value.asArray() || value.asDictionary() || value.asData();
}

// The same, with texts in place of values that JSON events cannot contain, so that the effect of filters on
// them is visible.
Given flattened(Given given) {
  const auto flatten = [](Dictionary& dictionary) {
    for (const auto& [key, value] : Dictionary(dictionary))
      if (isContainer(value)) dictionary.set(key, "");
  };
  for (GivenMessage& message : given.messages)
    if (message.payload) flatten(*message.payload);
  if (given.userInfo) flatten(*given.userInfo);
  return given;
}

SharedProfile withoutFilters(const config::HTTPSPostProfile& profile) {
  config::HTTPSPostProfile bare = profile;
  for (ClientEntry& entry : *bare.clients)
    if (entry.filters) entry.filters = config::Filters{};
  return std::make_shared<const config::Profile>(std::move(bare));
}

double chanceOf(const BackendExplanation& told) {
  switch (told.reason) {
    case Reason::reports:
    case Reason::held_by_sampling:
    case Reason::sampled_out:
      return std::clamp(told.threshold.value_or(0), 0.0, 1.0);
    default:
      return told.state == backends::kBackendReporting ? 1 : 0;
  }
}

// The changes that filters made: `plain` is the same message without filters. They may hash values that JSON
// events cannot contain, which do not leave.
config::EditedFields editsOfFilters(const Dictionary& filtered, const Dictionary& plain,
                                    const Dictionary& leaving) {
  config::EditedFields edits;
  for (const auto& [key, value] : plain) {
    const Value* left = filtered.find(key);
    if (left != nullptr && *left == value) continue;
    (left != nullptr && leaving.contains(key) ? edits.hashed : edits.removed).insert(key);
  }
  return edits;
}

template <typename Told>
void addEdits(const config::EditedFields& edits, Told& told) {
  told.removed.insert(edits.removed.begin(), edits.removed.end());
  told.hashed.insert(edits.hashed.begin(), edits.hashed.end());
}

// The user info takes the place of the message's fields of the same name, and filters come last.
void addLaterEdits(const config::EditedFields& edits, LeavingEvent& told) {
  for (const auto* names : {&edits.removed, &edits.hashed}) {
    for (const std::string& name : *names) {
      told.removed.erase(name);
      told.hashed.erase(name);
    }
  }
  addEdits(edits, told);
}

// If a field of the user info is removed, the message's field of the same name remains.
config::EditedFields editsOfUserInfo(const DryRun& run, std::size_t message) {
  config::EditedFields edits = run.userInfoEdits();
  for (const std::string& name : run.editsOf(message).hashed) edits.removed.erase(name);
  return edits;
}

// Removes values from an event that differ in every run.
void hideFactsOfARun(const DryRun& run, const Dictionary& plain, std::size_t message, Dictionary& event) {
  for (const char* key : kFactsOfARun)
    if (event.contains(key)) event.set(key, nullValue());
  const auto isKeyedDigest = [&](const std::string& key, const config::EditedFields& edits,
                                 const Dictionary& after) {
    const Value* given = after.find(key);
    const Value* sent = plain.find(key);
    return edits.hashed.contains(key) && given && sent && *given == *sent;
  };
  for (const auto& [key, value] : Dictionary(event)) {
    if (isKeyedDigest(key, run.editsOf(message), run.payloadOf(message)) ||
        (run.sentUserInfo() && isKeyedDigest(key, run.userInfoEdits(), *run.sentUserInfo())))
      event.set(key, nullValue());
  }
}

void tellEvents(const DryRun& run, const Given& given, const std::string& name,
                const config::HTTPSPostProfile& profile, BackendExplanation& told) {
  if (run.events().empty()) return;
  const Given flat = flattened(given);
  DryRun filtered(flat, name, std::make_shared<const config::Profile>(profile));
  DryRun plain(flat, name, withoutFilters(profile));
  filtered.play();
  plain.play();
  for (const auto& [message, event] : run.events()) {
    const auto withFilters = filtered.events().find(message);
    const auto without = plain.events().find(message);
    if (withFilters == filtered.events().end() || without == plain.events().end()) continue;
    LeavingEvent left{event, message, {}, {}};
    addEdits(run.editsOf(message), left);
    addLaterEdits(editsOfUserInfo(run, message), left);
    addLaterEdits(editsOfFilters(withFilters->second, without->second, event), left);
    hideFactsOfARun(run, without->second, message, left.fields);
    told.removed.insert(left.removed.begin(), left.removed.end());
    told.hashed.insert(left.hashed.begin(), left.hashed.end());
    told.events.push_back(std::move(left));
  }
}

void tellHTTPS(const DryRun& run, BackendExplanation& told) {
  const auto& backend = static_cast<const backends::HTTPSPostBackend&>(*run.backend());
  const backends::HTTPSPostState& state = backend.clientState();
  told.match = state.match();
  told.threshold = backend.samplingThreshold();
  told.hierarchy = backend.hierarchy();
  told.batched = state.batchEvents(*backend.facts());
  told.eventThreshold = state.eventThreshold();
  told.url = state.links().postURL();
  told.realtimeUrl = state.links().realtimePostURL();
}

BackendExplanation explainBackend(const Given& given, const std::string& name, const SharedProfile& profile) {
  BackendExplanation told;
  DryRun run(given, name, profile);
  if (run.backend() == nullptr) {
    told.reason = run.reasonAgainst();
    told.fates.assign(given.messages.size(), {wire::Fate::dropped, std::nullopt});
    return told;
  }
  const backends::StateVerdict verdict = run.backend()->stateVerdict();
  told.state = verdict.state;
  told.reason = verdict.reason;
  const auto* https = profile ? std::get_if<config::HTTPSPostProfile>(profile.get()) : nullptr;
  const auto* upload = profile ? std::get_if<config::UploadProfile>(profile.get()) : nullptr;
  if (https) tellHTTPS(run, told);
  if (upload) told.url = upload->postURL;
  told.chance = chanceOf(told);
  if (name == wire::kVeltraBackendMivo) {
    // The storebag does not decide whether there is an adaptor.
    const bool delivers = told.state == backends::kBackendReporting;
    told.fates.assign(given.messages.size(), {delivers ? wire::Fate::delivered : wire::Fate::dropped, {}});
    return told;
  }
  run.play();
  for (std::size_t i = 0; i < given.messages.size(); ++i) {
    told.fates.push_back(run.fateOf(i + 1));
    if (told.fates.back().fate == wire::Fate::written) addEdits(run.editsOf(i + 1), told);
  }
  if (https) tellEvents(run, given, name, *https, told);
  return told;
}

// Without a socket, which would need a network.
BackendExplanation explainDashboard(const Given& given, const std::string& name,
                                    const config::DashboardProfile* profile) {
  BackendExplanation told;
  const std::size_t count = given.messages.size();
  told.fates.assign(count, {wire::Fate::dropped, std::nullopt});
  DryWorld world(given, name);
  const auto decision = world.gate.decision();
  const bool hasServer = profile && profile->ip && profile->port;
  told.reason = Reason::bad_address;
  if (!decision->policy->makes(name))
    told.reason = Reason::policy_backends;
  else if (hasServer && decision->refusalFor(name, {*profile->ip}) == Reason::policy_hosts)
    told.reason = Reason::policy_hosts;
  if (told.reason != Reason::bad_address || !hasServer ||
      !backends::parseIPv4Address(*profile->ip, *profile->port))
    return told;
  const auto refusal = decision->refusalFor(name, {*profile->ip});
  told.state = refusal ? backends::kBackendDisabled : backends::kBackendReporting;
  told.reason = refusal.value_or(Reason::always);
  told.chance = chanceOf(told);
  told.url = "udp://" + *profile->ip + ":" + std::to_string(*profile->port);
  if (refusal) return told;
  told.fates.assign(count, {profile->reliable.on ? wire::Fate::waiting : wire::Fate::sent, told.url});
  for (const GivenMessage& message : given.messages) {
    Dictionary payload = message.payload.value_or(Dictionary());
    config::EditedFields edits;
    if (decision->fields) decision->fields->apply(payload, edits);
    addEdits(edits, told);
    char field[backends::PacketText::kSize];
    backends::PacketText(field).append(payload);
    told.texts.emplace_back(field);
    // Only the device knows its digests, which have determined the place of the field.
    for (const std::string& key : edits.hashed) {
      const std::string* digest = payload.string(key);
      const std::size_t at = digest ? told.texts.back().find(*digest) : std::string::npos;
      if (at != std::string::npos) told.texts.back().replace(at, digest->size(), "null");
    }
  }
  return told;
}

}  // namespace

Explanation explain(const Dictionary& storebag, const Given& given) {
  const Silence silence;
  Explanation told;
  const auto parsed = config::parsed<config::Storebag>(storebag);
  if (const char* name = config::storebagNameForClientType(given.clientType)) told.storebag = name;
  told.version = parsed.version;
  const Dictionary* section = config::sectionOf(parsed, given.environment);
  if (section == nullptr || !told.storebag) return told;
  const bool isRelease = section == config::sectionOf(parsed, kReleaseEnvironment);
  told.section = config::sectionNameForEnvironment(isRelease ? kReleaseEnvironment : given.environment);
  const auto content = config::parseSection(*section);
  for (const auto& [name, profile] : content->backends) {
    told.backends[name] =
        name == wire::kVeltraBackendDashboard
            ? explainDashboard(given, name, std::get_if<config::DashboardProfile>(profile.get()))
            : explainBackend(given, name, profile);
  }
  return told;
}

}  // namespace veltrad::storebag
