// SPDX-License-Identifier: Apache-2.0
// Applies changes of the owner's decision, and answers questions about it.
#include "daemon/privacy.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <memory>

#include "backends/backend_factory.h"
#include "backends/https/post_spool.h"
#include "base/null_value.h"
#include "config/preference_keys.h"
#include "daemon/veltrad_agent.h"
#include "platform/log.h"
#include "support/veltra.h"

namespace veltrad::daemon {

namespace {

using namespace std::chrono_literals;

// The HTTP thread may be reading certificates.
constexpr auto kHTTPPatience = 500ms;
// Posts may be on their way to the disk.
constexpr auto kSpoolPatience = 5s;
constexpr std::string_view kCustomIdentifier = "uuid:";

bool isIdentifier(std::string_view key) {
  return key == support::kIdentifierRespectingConsent || key == support::kIdentifierOverridingConsent ||
         key.starts_with(kCustomIdentifier);
}

// The size of the regular files in a directory whose names have this prefix.
std::uint64_t bytesIn(const std::string& directory, std::string_view beginning) {
  std::uint64_t bytes = 0;
  const std::unique_ptr<DIR, int (*)(DIR*)> opened(::opendir(directory.c_str()), ::closedir);
  while (const dirent* entry = opened ? ::readdir(opened.get()) : nullptr) {
    struct stat status {};
    if (std::string_view(entry->d_name).starts_with(beginning) &&
        ::fstatat(::dirfd(opened.get()), entry->d_name, &status, AT_SYMLINK_NOFOLLOW) == 0 &&
        S_ISREG(status.st_mode))
      bytes += static_cast<std::uint64_t>(status.st_size);
  }
  return bytes;
}

Value dateOrNull(const Value* value) {
  const Date* date = value ? value->asDate() : nullptr;
  return date ? date->secondsSince1970 : nullValue();
}

}  // namespace

void Privacy::hearOwner() {
  const Lock held(_mutex);
  const bool changed = obey();
  if (changed || _graceRuns) _services.http.endRefused(!changed);
  _graceRuns = changed;
}

// True if the decision has changed. A step that fails for lack of memory is repeated at the next call.
bool Privacy::obey() {
  _toBeTold = _services.gate.refresh() || _toBeTold;
  if (!_toBeTold) return false;
  const auto decision = _services.gate.decision();
  logInfo("hearOwner: The owner's word has changed: %s",
          decision->refusal ? wire::entryOf(*decision->refusal).name.data() : "back ends may report");
  _agent.tellOwnerDecision(*decision);
  _factory.dropWaiting([&decision](const std::string& host) {
    return decision->refusal.has_value() || !decision->policy->reaches(host);
  });
  _toBeTold = false;
  return true;
}

const char* Privacy::reporting() const {
  const auto refusal = _services.gate.decision()->refusal;
  return refusal == wire::Reason::privacy_off || refusal == wire::Reason::policy_reporting ||
                 refusal == wire::Reason::policy_broken
             ? "off"
             : "on";
}

Privacy::Answer Privacy::show() {
  const auto consent =
      _services.preferences.lookUp(platform::kVeltraPreferenceDomain, config::preference::kConsent);
  if (!consent) return Failure{consent.error().description};
  auto known = identifiers();
  if (!known) return Failure{known.error()};
  const auto decision = _services.gate.decision();
  const auto& given = consent.value();
  return Dictionary{
      {"reporting", reporting()},
      {"consent", given ? Value(given->toBoolean().value_or(false)) : nullValue()},
      {"policy", decision->policy->broken() ? Value("broken") : orNull(decision->policy->asGiven())},
      {"identifiers", std::move(known.value())},
      {"destinations", _services.destinations.lastDay()}};
}

Result<Array, std::string> Privacy::identifiers() {
  const auto all = _services.preferences.all(platform::kVeltraPreferenceDomain);
  if (!all) return Failure{all.error().description};
  const Dictionary* times = all.value().dictionary(platform::kMadeAt);
  Array found;
  for (const auto& [name, value] : all.value()) {
    if (!isIdentifier(name) || !value.asString()) continue;
    found.push_back(Dictionary{{"name", name},
                               {"value", value},
                               {"made", dateOrNull(times ? times->find(name) : nullptr)},
                               {"resettable", true}});
  }
  const auto device = _services.device.value("UniqueDeviceID");
  if (!device) return Failure{device.error().description};
  if (device.value()) {
    const bool given = _services.device.configures("UniqueDeviceID");
    const Value* reset = given ? nullptr : all.value().find(platform::kIdentifiersReset);
    found.push_back(Dictionary{{"name", "UniqueDeviceID"},
                               {"value", *device.value()},
                               {"made", dateOrNull(reset)},
                               {"resettable", !given}});
  }
  return found;
}

Privacy::Answer Privacy::turnOff() {
  const Lock held(_mutex);
  config::DropReceipt& receipt = _services.gate.receipt();
  receipt.begin();
  const auto stored = _services.preferences.change(platform::kVeltraPreferenceDomain,
                                                   config::preference::kReportingOff, true);
  if (!stored) {
    static_cast<void>(receipt.end());
    return Failure{stored.error()};
  }
  // First, so that all posts are counted here: the spool drops them by itself once the decision has changed.
  std::size_t posts = emptySpool(wire::Reason::privacy_off);
  _graceRuns = obey() || _graceRuns;
  const auto begun = _services.http.refuseWaiting(false, kHTTPPatience);
  posts += emptySpool(wire::Reason::privacy_off);
  for (const auto& client : _factory.preparingFiles()) receipt.add(http::Departure::Kind::file, client, 1);
  Dictionary dropped = receipt.end();
  dropped.set("posts", posts);
  std::uint64_t begunPosts = 0, events = 0, files = 0;
  for (const http::RequestUnderWay& one : begun ? *begun : std::vector<http::RequestUnderWay>()) {
    const bool post = one.lane == http::HTTPRequest::Lane::event;
    begunPosts += post ? 1 : 0;
    events += post ? one.events : 0;
    files += one.lane == http::HTTPRequest::Lane::upload ? 1 : 0;
  }
  return Dictionary{{"reporting", "off"},
                    {"dropped", std::move(dropped)},
                    {"underWay", Dictionary{{"posts", begunPosts}, {"events", events}, {"files", files}}},
                    {"onDisk", onDisk()}};
}

std::size_t Privacy::emptySpool(wire::Reason why) {
  return _spool ? _spool->empty(why, std::chrono::steady_clock::now() + kSpoolPatience) : 0;
}

Dictionary Privacy::onDisk() const {
  const platform::Root& root = _services.root;
  const std::string energy = root.energyLogPath();
  const std::string name = energy.substr(energy.rfind('/') + 1);
  return {{"messageLog", bytesIn(root.messageLogDirectory(), "veltrad_")},
          {"energyLog", bytesIn(root.logsDirectory(), name)},  // with those that were rotated away
          {"history", bytesIn(root.historyDirectory(), "")}};
}

Privacy::Answer Privacy::turnOn() {
  const Lock held(_mutex);
  const auto stored = _services.preferences.change(platform::kVeltraPreferenceDomain,
                                                   config::preference::kReportingOff, std::nullopt);
  if (!stored) return Failure{stored.error()};
  _graceRuns = obey() || _graceRuns;
  return Dictionary{{"reporting", reporting()}};
}

Privacy::Answer Privacy::resetIdentifiers() {
  const Lock held(_mutex);
  if (const auto renewed = _services.secret.renew(); !renewed) return Failure{renewed.error().description};
  const double now = platform::timevalToSeconds(_services.clock.now());
  const auto forgotten =
      _services.preferences.edit(platform::kVeltraPreferenceDomain, "identifiers", [now](Dictionary& all) {
        Dictionary kept;
        for (const auto& [name, value] : all) {
          if (!isIdentifier(name) && name != platform::kMadeAt) kept.set(name, value);
        }
        kept.set(platform::kIdentifiersReset, Date{now});
        all = std::move(kept);
        return true;
      });
  if (!forgotten) return Failure{forgotten.error()};
  for (const bool respecting : {true, false}) {
    if (!_library.getPersistentIdentifierForDNU(respecting))
      return Failure{std::string("The identifiers were forgotten, and others cannot be made just now.")};
  }
  _services.gate.identifiersReset();
  _graceRuns = obey() || _graceRuns;
  // Waiting data contains the old identifiers. Sessions take the new ones at their next call.
  std::size_t posts = emptySpool(wire::Reason::refused_by_owner);
  static_cast<void>(_services.http.refuseWaiting(true, kHTTPPatience));
  _agent.dropIdentified();
  _factory.dropWaiting([](const std::string&) { return true; });
  posts += emptySpool(wire::Reason::refused_by_owner);
  auto known = identifiers();
  if (!known) return Failure{known.error()};
  return Dictionary{{"identifiers", std::move(known.value())}, {"dropped", Dictionary{{"posts", posts}}}};
}

}  // namespace veltrad::daemon
