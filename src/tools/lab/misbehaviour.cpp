// SPDX-License-Identifier: Apache-2.0
// Reads rules and finds the one for a request.
#include "misbehaviour.h"

#include <algorithm>

#include "formats/json.h"

namespace veltrad::lab {
namespace {

// Each reader returns what it expected if it could not read the value.
using Wrong = std::optional<std::string>;

Wrong readText(const Value& value, std::string& into) {
  const std::string* text = value.asString();
  if (!text) return "a text";
  into = *text;
  return std::nullopt;
}

Wrong readBoolean(const Value& value, bool& into) {
  if (!value.isBoolean()) return "true or false";
  into = *value.toBoolean();
  return std::nullopt;
}

template <typename Number, typename T>
Wrong readInteger(const Value& value, std::int64_t least, std::int64_t most, T& into) {
  const auto number = value.isNumber() ? value.toInt64() : std::nullopt;
  if (!number || *number < least || *number > most)
    return "an integer from " + std::to_string(least) + " to " + std::to_string(most);
  into = Number(*number);
  return std::nullopt;
}

template <typename T>
struct Name {
  std::string_view name;
  T value;
};
constexpr Name<Rule::Signature> kSignatures[] = {{"wrong", Rule::Signature::wrong},
                                                 {"missing", Rule::Signature::missing},
                                                 {"none", Rule::Signature::none}};
constexpr Name<Rule::Acknowledgement> kAcknowledgements[] = {
    {"drop", Rule::Acknowledgement::dropped},      {"duplicate", Rule::Acknowledgement::duplicate},
    {"reorder", Rule::Acknowledgement::reordered}, {"short", Rule::Acknowledgement::tooShort},
    {"long", Rule::Acknowledgement::tooLong},      {"foreign", Rule::Acknowledgement::foreign},
    {"stranger", Rule::Acknowledgement::stranger}};

template <typename T, std::size_t count>
Wrong readName(const Value& value, const Name<T> (&names)[count], T& into) {
  std::string expected = "one of";
  for (const auto& [name, meant] : names) {
    if (value.asString() && *value.asString() == name) {
      into = meant;
      return std::nullopt;
    }
    expected.append(" \"").append(name).append("\"");
  }
  return expected;
}

Wrong readBody(const Value& value, std::string& into) {
  if (!value.asData()) return readText(value, into) ? Wrong(R"(a text or {"$data": base64})") : std::nullopt;
  into = value.asData()->bytes;
  return std::nullopt;
}

Wrong readStamp(const Value& value, std::optional<Stamp>& into) {
  auto stamp = stampFrom(value);
  if (!stamp) return stamp.error();
  into = std::move(stamp).value();
  return std::nullopt;
}

Wrong readHeaders(const Value& value, Dictionary& into) {
  const Dictionary* headers = value.asDictionary();
  const auto isText = [](const Dictionary::Entry& entry) { return entry.second.asString() != nullptr; };
  if (!headers || !std::all_of(headers->begin(), headers->end(), isText)) return "an object of texts";
  into = *headers;
  return std::nullopt;
}

Wrong readScript(const Value& value, std::vector<Rule>& into);

Wrong readEntry(const std::string& key, const Value& value, Rule& rule) {
  if (key == "script") return readScript(value, rule.script);
  if (key == "forMs") return readInteger<std::chrono::milliseconds>(value, 1, 3'600'000, rule.lasts);
  if (key == "path") return readText(value, rule.path);
  if (key == "cut") return readBoolean(value, rule.cut);
  if (key == "cutHalfway") return readBoolean(value, rule.cutHalfway);
  if (key == "stall") return readBoolean(value, rule.stall);
  if (key == "endless") return readBoolean(value, rule.endless);
  if (key == "lastModified") return readBoolean(value, rule.lastModified);
  if (key == "sign") return readName(value, kSignatures, rule.sign);
  if (key == "bag") return readStamp(value, rule.bag);
  if (key == "ack") return readName(value, kAcknowledgements, rule.acknowledgement);
  if (key == "headers") return readHeaders(value, rule.headers);
  if (key == "body") return readBody(value, rule.body.emplace());
  if (key == "times") return readInteger<std::int64_t>(value, 1, 1'000'000'000, rule.times);
  if (key == "share") return readInteger<std::int64_t>(value, 0, 100, rule.share);
  if (key == "status") return readInteger<int>(value, 200, 599, rule.status);
  if (key == "delayMs") return readInteger<std::chrono::milliseconds>(value, 0, 3'600'000, rule.delay);
  if (key == "dripMs") return readInteger<std::chrono::milliseconds>(value, 0, 3'600'000, rule.drip);
  return "one of path, times, share, status, delayMs, dripMs, cut, cutHalfway, stall, endless, sign, "
         "bag, ack, lastModified, headers, body, script, forMs";
}

// A request takes the first that has not ended; one without times or a time is for one request.
Wrong readScript(const Value& value, std::vector<Rule>& into) {
  const Array* steps = value.asArray();
  if (!steps || steps->empty()) return "an array of rules without paths";
  for (const Value& one : *steps) {
    const Dictionary* entries = one.asDictionary();
    if (!entries) return "an array of rules without paths";
    Rule step;
    for (const auto& [key, inner] : *entries) {
      if (key == "path" || key == "script") return "an array of rules without paths";
      if (const Wrong expected = readEntry(key, inner, step)) return "in \"" + key + "\" " + *expected;
    }
    if (!step.times && !step.lasts) step.times = 1;
    into.push_back(std::move(step));
  }
  return std::nullopt;
}

}  // namespace

Result<Rule, std::string> ruleFromJSON(std::string_view text) {
  const auto parsed = formats::parseJSON(text);
  if (!parsed)
    return Failure{"no JSON at byte " + std::to_string(parsed.error().offset) + ": " + parsed.error().detail};
  const Dictionary* entries = parsed.value().asDictionary();
  if (!entries)
    return Failure{std::string(R"(expected a JSON object, for instance {"path": "/events", "status": 503})")};
  Rule rule;
  for (const auto& [key, value] : *entries) {
    if (const Wrong expected = readEntry(key, value, rule))
      return Failure{"\"" + key + "\": expected " + *expected};
  }
  return rule;
}

void Misbehaviour::add(Rule rule) {
  const Lock hold(_mutex);
  std::erase_if(_rules, [&](const Rule& other) { return other.path == rule.path; });
  _rules.push_back(std::move(rule));
}

std::optional<Rule> Misbehaviour::take(std::string_view path) {
  const Lock hold(_mutex);
  auto best = _rules.end();
  for (auto rule = _rules.begin(); rule != _rules.end(); ++rule) {
    if (path.starts_with(rule->path) && (best == _rules.end() || rule->path.size() > best->path.size()))
      best = rule;
  }
  if (best == _rules.end()) return std::nullopt;
  if (best->share && static_cast<std::int64_t>(_draw() % 100) >= *best->share) return std::nullopt;
  return applied(best);
}

// Removes what has ended.
std::optional<Rule> Misbehaviour::applied(std::vector<Rule>::iterator rule) {
  const auto now = std::chrono::steady_clock::now();
  auto& script = rule->script;
  const auto over = [now](Rule& one) {
    if (one.lasts && !one.end) one.end = now + *one.lasts;
    return one.end && *one.end <= now;
  };
  const bool scripted = !script.empty();
  while (!script.empty() && over(script.front())) script.erase(script.begin());
  if ((scripted && script.empty()) || over(*rule)) {
    _rules.erase(rule);
    return std::nullopt;
  }
  Rule& step = scripted ? script.front() : *rule;
  Rule taken = step;
  taken.generation = _generation;
  if (step.times && --*step.times == 0) {
    if (scripted) script.erase(script.begin());
    if (script.empty()) _rules.erase(rule);
  }
  return taken;
}

void Misbehaviour::reset() {
  const Lock hold(_mutex);
  _rules.clear();
  ++_generation;
  _changed.notifyAll();
}

void Misbehaviour::stop() {
  {
    const Lock hold(_mutex);
    _stopped = true;
  }
  reset();
}

bool Misbehaviour::hold(std::uint64_t generation, std::optional<std::chrono::milliseconds> time) {
  const auto until = std::chrono::steady_clock::now() + time.value_or(std::chrono::hours(24 * 365));
  const Lock hold(_mutex);
  while (!_stopped && _generation == generation && std::chrono::steady_clock::now() < until)
    _changed.waitUntil(_mutex, until);
  return !_stopped && _generation == generation;
}

bool Misbehaviour::stopped() const {
  const Lock hold(_mutex);
  return _stopped;
}

std::uint64_t Misbehaviour::generation() const {
  const Lock hold(_mutex);
  return _generation;
}

}  // namespace veltrad::lab
