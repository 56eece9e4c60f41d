// SPDX-License-Identifier: Apache-2.0
// Compares sections and back ends as devices get them.
#include "storebag/storebag_diff.h"

#include <fmt/format.h>

#include <set>

#include "backends/dashboard/udp_socket.h"
#include "config/client_types.h"
#include "config/preference_keys.h"
#include "config/storebag_content.h"
#include "config/storebag_section.h"
#include "storebag/clients_diff.h"
#include "storebag/entry_diff.h"
#include "storebag/silence.h"
#include "storebag/words.h"
#include "wire/constants.h"

namespace veltrad::storebag {
namespace {

using config::DashboardProfile;
using config::HTTPSPostProfile;
using config::Profile;
using config::UploadProfile;
using enum ChangeKind;
using SharedProfile = std::shared_ptr<const Profile>;

template <typename Kind>
const Kind* as(const SharedProfile& profile) {
  return profile ? std::get_if<Kind>(profile.get()) : nullptr;
}

bool isDashboard(const DashboardProfile& profile) {
  return profile.ip && profile.port && backends::parseIPv4Address(*profile.ip, *profile.port);
}

// Whether the daemon makes a back end of it.
bool isMade(const std::string& name, const SharedProfile& profile) {
  if (const auto* https = as<HTTPSPostProfile>(profile)) return https->clients.has_value();
  if (const auto* dashboard = as<DashboardProfile>(profile)) return isDashboard(*dashboard);
  if (const auto* upload = as<UploadProfile>(profile)) return upload->postURL.has_value();
  return name == wire::kVeltraBackendAmpery || name == wire::kVeltraBackendMivo;
}

// The purpose of a back end: "events go to c.example".
std::string purposeOf(const SharedProfile& profile, const std::string& name, const char* verb) {
  if (const auto* https = as<HTTPSPostProfile>(profile)) {
    std::set<std::string> hosts;
    for (const config::ClientEntry& entry : *https->clients)
      for (const auto& address : {entry.postURL, entry.realtimePostURL})
        if (!recipientOf(address).empty()) hosts.insert(recipientOf(address));
    return hosts.empty() ? "it has no address" : fmt::format("events {} to {}", verb, listedWithAnd(hosts));
  }
  if (const auto* dashboard = as<DashboardProfile>(profile))
    return fmt::format("all messages {} in clear to {}:{}", verb, *dashboard->ip, *dashboard->port);
  if (const auto* upload = as<UploadProfile>(profile))
    return fmt::format("files {} to {}", verb, *upload->postURL);
  const bool isLog = name == wire::kVeltraBackendAmpery;
  return fmt::format("messages {} to the {}, on the device", verb, isLog ? "energy log" : "adaptor");
}

// One back end of one section.
class BackendDiff {
 public:
  BackendDiff(const std::string& section, const std::string& name, std::vector<Change>& changes)
      : _name(name), _at{section, name, {}, {}, {}}, _changes(changes), _sink(changes, _at) {}

  void compare(const config::StorebagSection& before, const config::StorebagSection& now) {
    const SharedProfile old = profileIn(before), current = profileIn(now);
    _old = before.asGiven.dictionary(_name);
    _now = now.asGiven.dictionary(_name);
    const bool was = _old && isMade(_name, old), is = _now && isMade(_name, current);
    if (was != is) return sayBackend(is ? current : old, is);
    if (!is) return;
    sayAddress("display_url", "display_url", Effect::other);
    if (const auto* dashboard = as<DashboardProfile>(current))
      compareDashboards(*as<DashboardProfile>(old), *dashboard);
    else if (const auto* upload = as<UploadProfile>(current))
      compareUploads(*as<UploadProfile>(old), *upload);
    else if (as<HTTPSPostProfile>(current))
      compareClients(*_old->array("clients"), *_now->array("clients"), _at, _changes);
  }

 private:
  SharedProfile profileIn(const config::StorebagSection& section) const {
    const auto at = section.backends.find(_name);
    return at == section.backends.end() ? nullptr : at->second;
  }

  // The energy log stays on the device.
  void sayBackend(const SharedProfile& profile, bool isNew) {
    const bool leaves = _name != wire::kVeltraBackendAmpery;
    const auto value = [](const Dictionary* content) {
      return content ? std::optional<Value>(*content) : std::nullopt;
    };
    const Effect effect = !leaves ? Effect::other : isNew ? Effect::more : Effect::less;
    _sink.say(backend, effect, std::nullopt, value(_old), value(_now),
              isNew ? fmt::format("back end {} is new: {}", _name, purposeOf(profile, _name, "go"))
                    : fmt::format("back end {} is gone: {}", _name, purposeOf(profile, _name, "went")));
  }

  void sayAddress(const char* key, const std::string& what, Effect effect) {
    const auto before = valueIn(_old, key), now = valueIn(_now, key);
    if (before == now) return;
    const auto shown = [](const std::optional<Value>& value) {
      return value ? value->toText().value_or("nothing") : std::string("nothing");
    };
    _sink.say(address, effect, key, before, now,
              fmt::format("{}: now {}, before {}", what, shown(now), shown(before)));
  }

  void compareDashboards(const DashboardProfile& before, const DashboardProfile& now) {
    if (before.ip != now.ip) sayAddress("ip", "all messages go to another host", Effect::more);
    if (before.port != now.port) sayAddress("port", "port of the dashboard", Effect::other);
    if (before.postURL != now.postURL)
      sayAddress("post_url", "log data", effectOfAddress(before.postURL, now.postURL));
    if (before.reliable == now.reliable) return;
    _sink.sayKey(batching, Effect::other, "reliable", _old, _now,
                 !now.reliable.on      ? "datagrams are no longer repeated until they are acknowledged"
                 : !before.reliable.on ? "datagrams are now repeated until they are acknowledged"
                                       : "the pause before a datagram is repeated is another");
  }

  void compareUploads(const UploadProfile& before, const UploadProfile& now) {
    if (before.postURL == now.postURL) return;
    const Effect effect = effectOfAddress(before.postURL, now.postURL);
    sayAddress("post_url", effect == Effect::more ? "files go to another host" : "files", effect);
  }

  const std::string& _name;
  const ChangePlace _at;
  std::vector<Change>& _changes;
  ChangeSink _sink;
  const Dictionary* _old = nullptr;
  const Dictionary* _now = nullptr;
};

void compareSections(const std::string& name, const Dictionary* before, const Dictionary* now,
                     std::vector<Change>& changes) {
  const auto old = config::parseSection(before ? *before : Dictionary());
  const auto current = config::parseSection(now ? *now : Dictionary());
  std::set<std::string> backends;
  for (const auto* section : {&old, &current})
    for (const auto& [backend, profile] : (*section)->backends) backends.insert(backend);
  for (const std::string& backend : backends) BackendDiff(name, backend, changes).compare(*old, *current);
}

// Compares the claims and other keys of the top level.
void compareTop(const Dictionary& before, const Dictionary& now, std::vector<Change>& changes) {
  ChangeSink sink(changes, {});
  const auto shown = [](const std::optional<Value>& value) {
    return value ? value->toText().value_or("another") : std::string("none");
  };
  for (const char* key : {"version", "refresh_cycle", "serial", "expires", "name", "revoked"}) {
    const auto old = valueIn(&before, key), current = valueIn(&now, key);
    if (old == current) continue;
    const bool isCycle = key == std::string_view("refresh_cycle");
    sink.say(isCycle ? refresh : version, Effect::other, key, old, current,
             fmt::format("{}: {}, now {}", key, shown(old), shown(current)));
  }
}

}  // namespace

std::vector<Change> changesOf(const Dictionary& before, const Dictionary& now) {
  const Silence silence;
  std::vector<Change> changes;
  const auto old = config::parsed<config::Storebag>(before), current = config::parsed<config::Storebag>(now);
  for (std::uint32_t environment = 1; const char* name = config::sectionNameForEnvironment(environment);
       ++environment) {
    // Without a section of their own, devices of "seed" get that of "release".
    if (environment == config::kSeedEnvironment && !old.seed && !current.seed) continue;
    compareSections(name, config::sectionOf(old, environment), config::sectionOf(current, environment),
                    changes);
  }
  compareTop(before, now, changes);
  sortWorstFirst(changes);
  return changes;
}

}  // namespace veltrad::storebag
