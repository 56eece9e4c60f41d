// SPDX-License-Identifier: Apache-2.0
// Reads scenarios. Settings and storebags are read by the daemon's own tables of keys.
#include "scenario.h"

#include <fmt/format.h>

#include <set>
#include <utility>

#include "config/storebag_content.h"
#include "wire/constants.h"

namespace veltrad::simulate {

namespace {

// The keys of a dictionary; keeps the first thing that is wrong.
class Keys {
 public:
  Keys(const Dictionary& given, std::string where, std::optional<std::string>& wrong)
      : _given(given), _where(std::move(where)), _wrong(wrong) {}

  const Value* find(const char* key) {
    _known.insert(key);
    return _given.find(key);
  }
  template <typename Number>
  void take(const char* key, Number& field, double least, double most) {
    const Value* value = find(key);
    if (!value) return;
    const auto number = value->isBoolean() ? std::nullopt : value->toDouble();
    if (!number || !(*number >= least && *number <= most))
      return say(key, fmt::format("expected a number from {} to {}", least, most));
    field = static_cast<Number>(*number);
  }
  const Dictionary* dictionary(const char* key) {
    const Value* value = find(key);
    if (value && !value->asDictionary()) say(key, "expected a dictionary");
    return value ? value->asDictionary() : nullptr;
  }
  const std::string* text(const char* key) {
    const Value* value = find(key);
    if (value && !value->asString()) say(key, "expected a text");
    return value ? value->asString() : nullptr;
  }
  void end() {
    for (const auto& [name, value] : _given) {
      if (!_known.contains(name)) say(name.c_str(), "unknown key");
    }
  }
  void say(const char* key, const std::string& what) {
    if (!_wrong) _wrong = fmt::format("{}\"{}\": {}", _where, key, what);
  }

 private:
  const Dictionary& _given;
  const std::string _where;
  std::optional<std::string>& _wrong;
  std::set<std::string, std::less<>> _known;
};

Bag bagFrom(const Dictionary& given, std::optional<std::string>& wrong) {
  Bag bag;
  const auto storebag = config::parsed<config::Storebag>(given);
  bag.refreshCycle = storebag.refreshCycle;
  const auto section = config::parseSection(storebag.release.value_or(Dictionary()));
  const auto profileOf = [&section](const char* name) {
    const auto at = section->backends.find(name);
    return at == section->backends.end() ? nullptr : at->second.get();
  };
  const config::Profile* posts = profileOf(wire::kVeltraBackendHTTPPost);
  const auto* clients = posts ? &std::get<config::HTTPSPostProfile>(*posts).clients : nullptr;
  if (!clients || !*clients || (*clients)->empty()) {
    wrong = R"("bag": expected "release", "httppost", "clients" with an entry)";
    return bag;
  }
  bag.entry = (*clients)->front();
  if (const config::Profile* dashboard = profileOf(wire::kVeltraBackendDashboard)) {
    const config::Reliable& reliable = std::get<config::DashboardProfile>(*dashboard).reliable;
    bag.reliable = reliable.on;
    if (reliable.milliseconds > 0) bag.period = std::chrono::milliseconds(reliable.milliseconds);
  }
  return bag;
}

constexpr std::pair<const char*, Incident::What> kIncidents[] = {
    {"storebagsDown", Incident::What::storebagsDown},
    {"collectorAnswers", Incident::What::collectorAnswers},
    {"dashboardsDown", Incident::What::dashboardsDown},
    {"powerCut", Incident::What::powerCut},
    {"push", Incident::What::push}};

Incident incidentFrom(const Dictionary& given, Scenario& scenario, std::optional<std::string>& wrong) {
  Incident incident;
  Keys keys(given, "\"incidents\": ", wrong);
  const std::string* what = keys.text("what");
  bool known = false;
  for (const auto& [name, kind] : kIncidents) {
    if (!what || *what != name) continue;
    incident.what = kind;
    known = true;
  }
  if (!known) keys.say("what", "expected storebagsDown, collectorAnswers, dashboardsDown, powerCut or push");
  keys.take("at", incident.at, 0, 1e7);
  keys.take("lasts", incident.lasts, 0, 1e7);
  keys.take("status", incident.status, 0, 599);
  keys.take("retryAfter", incident.retryAfter, 0, 86'400);
  keys.take("share", incident.share, 0, 1);
  keys.take("bootsWithin", incident.bootsWithin, 0, 1e6);
  if (const Dictionary* bag = keys.dictionary("bag")) {
    incident.bag = scenario.bags.size();
    scenario.bags.push_back(bagFrom(*bag, wrong));
  }
  keys.end();
  return incident;
}

}  // namespace

Result<Scenario, std::string> scenarioFrom(const Dictionary& given) {
  constexpr double kMostBags = 255;
  Scenario scenario;
  std::optional<std::string> wrong;
  Keys keys(given, "", wrong);
  keys.take("devices", scenario.devices, 1, 1e8);
  keys.take("hours", scenario.hours, 0.01, 1000);
  keys.take("seed", scenario.seed, 0, 1e15);
  keys.take("messagesPerHour", scenario.messagesPerHour, 0.001, 3600);
  keys.take("sessionsPerHour", scenario.sessionsPerHour, 0.001, 3600);
  keys.take("sessionSeconds", scenario.sessionSeconds, 1, 86'400);
  keys.take("messagesPerSession", scenario.messagesPerSession, 0, 10'000);
  keys.take("upDays", scenario.upDays, 0, 1000);
  keys.take("lossOfDatagrams", scenario.lossOfDatagrams, 0, 1);
  keys.take("timeout", scenario.timeout, 0, 60);
  keys.take("keepAlive", scenario.keepAlive, 0, 3600);
  if (const std::string* text = keys.text("cacheControl")) scenario.cacheControl = *text;
  if (const Value* value = keys.find("conditional")) {
    if (!value->isBoolean()) keys.say("conditional", "expected true or false");
    scenario.conditional = value->toBoolean().value_or(true);
  }
  if (const Dictionary* settings = keys.dictionary("settings"))
    scenario.settings = config::parsed<config::OperatorChoices>(*settings);
  const Dictionary* bag = keys.dictionary("bag");
  scenario.bags.push_back(bagFrom(bag ? *bag : Dictionary(), wrong));
  if (const Value* incidents = keys.find("incidents")) {
    const Array* array = incidents->asArray();
    if (!array) keys.say("incidents", "expected an array");
    for (const Value& one : array ? *array : Array()) {
      if (!one.asDictionary()) keys.say("incidents", "expected an array of dictionaries");
      scenario.incidents.push_back(
          incidentFrom(one.asDictionary() ? *one.asDictionary() : Dictionary(), scenario, wrong));
    }
  }
  keys.end();
  if (static_cast<double>(scenario.bags.size()) > kMostBags) keys.say("incidents", "too many storebags");
  if (wrong) return Failure{*wrong};
  return scenario;
}

}  // namespace veltrad::simulate
