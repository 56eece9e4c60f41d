// SPDX-License-Identifier: Apache-2.0
// Reads a suite, plays its cases and compares.
#include "storebag/suite.h"

#include <fmt/format.h>

#include <algorithm>

#include "config/storebag_content.h"
#include "storebag/document.h"
#include "storebag/explanation.h"
#include "storebag/lint_sink.h"
#include "storebag/spelling.h"
#include "storebag/spot.h"

namespace veltrad::storebag {
namespace {

const std::vector<std::string> kExpectations{"state", "reason", "present", "absent", "hashed", "equal"};

std::string directoryOf(const std::string& file) {
  const std::size_t slash = file.rfind('/');
  return slash == std::string::npos ? "." : file.substr(0, slash);
}

// Numbers are the same whether they have a fraction of 0 or none.
bool isSame(const Value& a, const Value& b) {
  return a.isNumber() && b.isNumber() ? a.toDouble() == b.toDouble() : a == b;
}

std::string numberOrNull(const std::optional<std::int32_t>& number) {
  return number ? std::to_string(*number) : "null";
}

// Compares one back end with what is expected of it.
class Comparison {
 public:
  // `told` is null if the section has no such back end.
  Comparison(std::string name, const BackendExplanation* told, std::size_t messages, CaseResult& result)
      : _name(std::move(name)), _isThere(told != nullptr), _result(result) {
    if (told) _told = *told;
    // The rules are about the messages that are given, if any are.
    for (const LeavingEvent& event : _told.events)
      if (messages == 0 || event.message > 0) _events.push_back(&event);
  }

  void compare(const Spot& at, const Dictionary& expected) {
    compareState(at, expected);
    if (const std::string* reason = expected.string("reason")) {
      const std::string got(_isThere ? wire::entryOf(_told.reason).name : "no such back end");
      if (*reason != got) fail("reason", quoted(*reason), quoted(got));
    }
    forEachField(expected, "present", [](const LeavingEvent& event, const std::string& field) {
      return event.fields.contains(field);
    });
    forEachField(expected, "hashed", [](const LeavingEvent& event, const std::string& field) {
      return event.fields.contains(field) && event.hashed.contains(field);
    });
    compareAbsent(expected);
    compareEqual(expected);
  }

 private:
  void fail(const char* what, std::string wanted, std::string got) {
    _result.failures.push_back({_name, what, std::move(wanted), std::move(got)});
  }

  // "state": null expects that the back end is not made.
  void compareState(const Spot& at, const Dictionary& expected) {
    const Value* state = expected.find("state");
    const bool isNull = !state && at.inside && at.inside->find("state");
    if (!state && !isNull) return;
    const auto wanted = state ? state->toInt32() : std::nullopt;
    if (wanted != _told.state) fail("state", numberOrNull(wanted), numberOrNull(_told.state));
  }

  template <typename Holds>
  void forEachField(const Dictionary& expected, const char* what, Holds holds) {
    const Array* fields = expected.array(what);
    for (std::size_t i = 0; fields && i < fields->size(); ++i) {
      const std::string field = (*fields)[i].toText().value_or("");
      const auto wrong = std::find_if(_events.begin(), _events.end(),
                                      [&](const LeavingEvent* event) { return !holds(*event, field); });
      if (_events.empty())
        fail(what, quoted(field), quoted("no event leaves"));
      else if (wrong != _events.end())
        fail(what, quoted(field), shownField((*wrong)->fields, field));
    }
  }

  void compareAbsent(const Dictionary& expected) {
    const Array* fields = expected.array("absent");
    for (std::size_t i = 0; fields && i < fields->size(); ++i) {
      const std::string field = (*fields)[i].toText().value_or("");
      for (const LeavingEvent& event : _told.events) {
        if (!event.fields.contains(field)) continue;
        fail("absent", quoted(field), shownField(event.fields, field));
        break;
      }
    }
  }

  void compareEqual(const Dictionary& expected) {
    const Dictionary* fields = expected.dictionary("equal");
    if (fields == nullptr) return;
    for (const auto& [field, wanted] : *fields) {
      const std::string text = fmt::format("{{{}:{}}}", quoted(field), shownValue(wanted));
      if (_events.empty()) fail("equal", text, quoted("no event leaves"));
      for (const LeavingEvent* event : _events) {
        const Value* value = event->fields.find(field);
        if (value && isSame(*value, wanted)) continue;
        fail("equal", text, shownField(event->fields, field));
        break;
      }
    }
  }

  static std::string shownField(const Dictionary& event, const std::string& field) {
    const Value* value = event.find(field);
    if (value == nullptr) return quoted("an event without the field");
    return fmt::format("{{{}:{}}}", quoted(field), shownValue(*value));
  }

  const std::string _name;
  const bool _isThere;
  CaseResult& _result;
  BackendExplanation _told;
  std::vector<const LeavingEvent*> _events;
};

class Suite {
 public:
  Suite(const Document& document, Dictionary storebag)
      : _file(document.file), _directory(directoryOf(document.file)), _storebag(std::move(storebag)) {}

  Result<CaseResult, std::string> run(const Spot& at, const Value& value) const {
    const Dictionary* content = value.asDictionary();
    const Dictionary* given = content ? content->dictionary("given") : nullptr;
    const Dictionary* expected = content ? content->dictionary("expect") : nullptr;
    if (!given || !expected) return wrong(at, "a case needs the objects \"given\" and \"expect\"");
    const std::string* name = content->string("name");
    CaseResult result{name ? *name : at.path, {}};
    const auto read = givenOf(*given, _directory);
    if (!read) return wrong(at.key("given"), read.error());
    const Explanation told = explain(_storebag, read.value());
    for (const auto& [backend, rules] : *expected) {
      const Spot spot = at.key("expect").key(backend);
      if (const auto fault = faultOf(rules)) return wrong(spot, *fault);
      const auto found = told.backends.find(backend);
      if (found == told.backends.end() && !config::StorebagSection::kKeys.find(backend))
        return wrong(spot, unknownBackend(backend));
      Comparison(backend, found == told.backends.end() ? nullptr : &found->second,
                 read.value().messages.size(), result)
          .compare(spot, *rules.asDictionary());
    }
    return result;
  }

  Failure<std::string> wrong(const Spot& at, const std::string& what) const {
    return Failure{fmt::format("{}:{}:{}: {}", _file, at.place.line, at.place.column, what)};
  }

 private:
  static std::optional<std::string> faultOf(const Value& rules) {
    const Dictionary* dictionary = rules.asDictionary();
    if (dictionary == nullptr) return "expected an object with state, reason, present, absent, hashed, equal";
    for (const auto& [key, value] : *dictionary) {
      const bool isList = key == "present" || key == "absent" || key == "hashed";
      if (std::find(kExpectations.begin(), kExpectations.end(), key) == kExpectations.end())
        return fmt::format("unknown key {}{}", quoted(key), mostLike(key, kExpectations));
      const auto state = value.isNumber() ? value.toInt64() : std::nullopt;
      if (key == "state" && (!state || *state < 0 || *state > 3))
        return fmt::format("\"state\" is {}: expected an integer from 0 to 3, or null", shownValue(value));
      if (key == "reason" && !value.asString())
        return fmt::format("\"reason\" is {}: expected the name of a reason", shownValue(value));
      if (isList && !value.asArray())
        return fmt::format("\"{}\" is {}: expected an array of fields", key, shownValue(value));
      if (key == "equal" && !value.asDictionary())
        return fmt::format("\"equal\" is {}: expected an object of fields", shownValue(value));
    }
    return std::nullopt;
  }

  const std::string _file;
  const std::string _directory;
  const Dictionary _storebag;
};

}  // namespace

Result<SuiteResult, std::string> runSuite(const std::string& file) {
  const auto document = readDocument(file);
  if (!document) return Failure{document.error().line()};
  const Dictionary* content = document.value().content.asDictionary();
  const std::string* path = content ? content->string("storebag") : nullptr;
  const Array* cases = content ? content->array("cases") : nullptr;
  if (!path || !cases)
    return Failure{file + ":1:1: a suite needs \"storebag\", a path, and \"cases\", an array"};
  const auto bag = readStorebag(path->starts_with('/') ? *path : directoryOf(file) + "/" + *path);
  if (!bag) return Failure{bag.error().line()};
  const Suite suite(document.value(), bag.value().storebag);
  const Spot at = Spot::top(document.value().places).key("cases");
  SuiteResult result{file, {}};
  for (std::size_t i = 0; i < cases->size(); ++i) {
    auto one = suite.run(at.element(i), (*cases)[i]);
    if (!one) return Failure{one.error()};
    result.cases.push_back(std::move(one).value());
  }
  return result;
}

}  // namespace veltrad::storebag
