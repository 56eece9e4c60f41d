// What a storebag would do wrong. A value of the wrong type counts as absent, as it does for the daemon.
#include "storebag/lint.h"

#include <fmt/format.h>

#include <algorithm>
#include <initializer_list>

#include "base/text.h"
#include "config/client_types.h"
#include "formats/json.h"
#include "wire/constants.h"

namespace veltrad {
namespace {

enum class Kind { text, number, texts, array, dictionary, anything };

struct Key {
  const char* name;
  Kind kind;
};
using Keys = std::initializer_list<Key>;

constexpr Keys kStorebagKeys = {{"development", Kind::dictionary}, {"florn_internal", Kind::dictionary},
                                {"seed", Kind::dictionary},        {"release", Kind::dictionary},
                                {"version", Kind::text},           {"refresh_cycle", Kind::number}};
constexpr Keys kBackends = {
    {wire::kVeltraBackendDashboard, Kind::dictionary}, {wire::kVeltraBackendUploadServer, Kind::dictionary},
    {wire::kVeltraBackendHTTPPost, Kind::dictionary},  {wire::kVeltraBackendHTTPPost2, Kind::dictionary},
    {wire::kVeltraBackendAmpery, Kind::dictionary},    {wire::kVeltraBackendMivo, Kind::dictionary}};
constexpr Keys kHTTPSPostKeys = {{"clients", Kind::array}, {"display_url", Kind::text}};
constexpr Keys kUploadKeys = {{"post_url", Kind::text}, {"display_url", Kind::text}};
constexpr Keys kEntryKeys = {{"client", Kind::text},
                             {"service", Kind::text},
                             {"expedite", Kind::number},
                             {"hierarchy", Kind::number},
                             {"override_dnu", Kind::number},
                             {"locale_whitelist", Kind::texts},
                             {"device_whitelist", Kind::texts},
                             {"device_blacklist", Kind::texts},
                             {"filters", Kind::array},
                             {"sampling_threshold", Kind::number},
                             {"per_country_sampling_thresholds", Kind::array},
                             {"override_sampling", Kind::number},
                             {"event_threshold", Kind::number},
                             {"extras_on_internal", Kind::number},
                             {"custom_clientId", Kind::anything},
                             {"post_url", Kind::text},
                             {"realtime_post_url", Kind::text}};
constexpr Keys kFilterKeys = {
    {"key", Kind::text}, {"action", Kind::text}, {"method", Kind::number}, {"status", Kind::number}};
constexpr Keys kCountryKeys = {{"country", Kind::texts}, {"threshold", Kind::number}};

constexpr const char* kNobody = "refuses every client that requires user info";

const char* nameOf(Kind kind) {
  switch (kind) {
    case Kind::text:
      return "a text";
    case Kind::number:
      return "a number";
    case Kind::texts:
      return "an array of texts";
    case Kind::array:
      return "an array";
    case Kind::dictionary:
      return "a dictionary";
    case Kind::anything:
      break;
  }
  return "anything";
}

bool fits(const Value& value, Kind kind) {
  switch (kind) {
    case Kind::text:
      return value.asString() != nullptr;
    case Kind::number:
      return value.toDouble().has_value();
    case Kind::texts:
    case Kind::array:
      return value.asArray() != nullptr;
    case Kind::dictionary:
      return value.asDictionary() != nullptr;
    case Kind::anything:
      break;
  }
  return true;
}

bool holdsText(const Array* array) {
  return array != nullptr &&
         std::any_of(array->begin(), array->end(), [](const Value& item) { return item.asString(); });
}

std::string quoted(const std::string& text) {
  return formats::writeJSON(Value(text));
}

// Says what it finds in the order of its calls.
class Lint {
 public:
  void checkStorebag(const Dictionary& storebag) {
    checkKeys("storebag", "section or key", storebag, kStorebagKeys);
    if (!storebag.contains("version")) say("storebag", "no \"version\": events do not say which they follow");
    if (!storebag.contains("release"))
      say("storebag",
          "no \"release\": most devices get nothing, and those of \"seed\" have nothing to fall back on");
    for (std::uint32_t environment = 1; const char* name = config::sectionNameForEnvironment(environment);
         ++environment)
      if (const Dictionary* section = storebag.dictionary(name)) checkSection(name, *section);
  }
  std::vector<std::string> take() { return std::move(_findings); }

 private:
  void say(const std::string& place, const std::string& what) { _findings.push_back(place + ": " + what); }

  void checkKeys(const std::string& place, const char* what, const Dictionary& dictionary, Keys known) {
    for (const Dictionary::Entry& entry : dictionary) {
      const auto& name = entry.first;
      const Value& value = entry.second;
      const auto key = std::find_if(known.begin(), known.end(), [&](const Key& k) { return name == k.name; });
      if (key == known.end()) {
        std::string expected;
        for (const Key& k : known) expected += (expected.empty() ? "" : ", ") + std::string(k.name);
        say(place, fmt::format("unknown {} {}: expected one of {}", what, quoted(name), expected));
      } else if (!fits(value, key->kind)) {
        say(place, fmt::format("{} is not {}: counts as absent", quoted(name), nameOf(key->kind)));
      } else if (key->kind == Kind::texts) {
        for (const Value& item : *value.asArray())
          if (!item.asString())
            say(place, fmt::format("{} holds {}, which is no text", quoted(name), formats::writeJSON(item)));
      }
    }
  }

  // The array's dictionaries, by their places; what is none is said.
  template <typename Check>
  void forEach(const std::string& place, const Array* array, Check check) {
    for (std::size_t i = 0; array != nullptr && i < array->size(); ++i) {
      const std::string at = fmt::format("{}[{}]", place, i);
      if (const Dictionary* element = (*array)[i].asDictionary())
        check(at, *element);
      else
        say(at, "is not a dictionary: passed over");
    }
  }

  void checkSection(const std::string& place, const Dictionary& section) {
    checkKeys(place, "back end", section, kBackends);
    for (const char* name : {wire::kVeltraBackendHTTPPost, wire::kVeltraBackendHTTPPost2})
      if (const Dictionary* profile = section.dictionary(name)) checkClients(place + "." + name, *profile);
    if (const Dictionary* profile = section.dictionary(wire::kVeltraBackendUploadServer))
      checkUploads(place + "." + wire::kVeltraBackendUploadServer, *profile);
  }

  void checkUploads(const std::string& place, const Dictionary& profile) {
    checkKeys(place, "key", profile, kUploadKeys);
    if (!profile.string("post_url")) say(place, "no \"post_url\": the back end is left out");
    checkURL(place, profile, "post_url");
  }

  void checkURL(const std::string& place, const Dictionary& dictionary, const char* key) {
    const std::string* url = dictionary.string(key);
    if (url != nullptr && lowerCase(*url).rfind("https://", 0) != 0)
      say(place,
          fmt::format("\"{}\" does not begin with https://: nothing is posted to {}", key, quoted(*url)));
  }

  void checkClients(const std::string& place, const Dictionary& profile) {
    checkKeys(place, "key", profile, kHTTPSPostKeys);
    const Array* clients = profile.array("clients");
    if (clients == nullptr) return say(place, "no \"clients\": the back end is left out");
    if (clients->empty())
      say(place, fmt::format("\"clients\" is empty: {}, and has no URL for the others", kNobody));
    std::string everyones;  // the place of the first entry that matches everyone
    forEach(place + ".clients", clients, [&](const std::string& at, const Dictionary& entry) {
      if (!everyones.empty())
        say(at,
            fmt::format("never used for a client that requires user info: {} matches everyone", everyones));
      else if (!entry.string("client") && !entry.string("service"))
        everyones = at;
      checkEntry(at, entry);
    });
  }

  void checkEntry(const std::string& place, const Dictionary& entry) {
    checkKeys(place, "key", entry, kEntryKeys);
    const Array* countries = entry.array("per_country_sampling_thresholds");
    if (!holdsText(entry.array("locale_whitelist")))
      say(place, fmt::format("no country in \"locale_whitelist\": {}", kNobody));
    if (!entry.array("filters")) say(place, fmt::format("no \"filters\": {}", kNobody));
    if (!entry.real("sampling_threshold") && (countries == nullptr || countries->empty()))
      say(place, fmt::format("no \"sampling_threshold\", not even for a country: {}", kNobody));
    if (!entry.string("post_url")) say(place, "no \"post_url\": nothing can be posted");
    for (const char* key : {"post_url", "realtime_post_url"}) checkURL(place, entry, key);
    forEach(place + ".filters", entry.array("filters"),
            [this](const std::string& at, const Dictionary& filter) {
              checkKeys(at, "key", filter, kFilterKeys);
              if (!filter.string("key")) say(at, "no \"key\": matches nothing");
              const std::string* action = filter.string("action");
              if (action != nullptr && *action != "remove" && *action != "sha256")
                say(at, fmt::format("unknown \"action\" {}: the field is kept; expected remove or sha256",
                                    quoted(*action)));
            });
    forEach(place + ".per_country_sampling_thresholds", countries,
            [this](const std::string& at, const Dictionary& country) {
              checkKeys(at, "key", country, kCountryKeys);
              if (!holdsText(country.array("country"))) say(at, "no country in \"country\": never used");
              if (!country.real("threshold"))
                say(at, "no \"threshold\": in these countries it " + std::string(kNobody));
            });
  }

  std::vector<std::string> _findings;
};

}  // namespace

std::vector<std::string> lintStorebag(const Dictionary& storebag) {
  Lint lint;
  lint.checkStorebag(storebag);
  return lint.take();
}

}  // namespace veltrad
