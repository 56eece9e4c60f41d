// SPDX-License-Identifier: Apache-2.0
// The tables of the keys of a client entry, its filters and its country thresholds.
#include "config/client_entry.h"

#include "base/text.h"

namespace veltrad::config {
namespace {

using enum KeyType;
using enum Need;

constexpr const char* kRefusesEveryone = "refuses every client that requires user info";
constexpr Range kShare{0, 1};
constexpr Range kFromZero{0, kInt32.most};
constexpr Range kCodeOrAll{-1, kInt32.most};

constexpr auto kFilterKeys = keysOf<filterTag>({
    row<&filterTag::key>({"key", text, kUnbounded, required, "matches nothing",
                          "Name of the event field; letter case is ignored."}),
    row<&filterTag::action>({"action", text, kUnbounded, optional, "the field is kept",
                             "\"remove\" takes the field out, \"sha256\" replaces its value by the digest of "
                             "it, any other text keeps it."}),
    row<&filterTag::method>(
        sensibly(kCodeOrAll, {"method", integer, kInt32, optional, "-1",
                              "The filter holds for events of this method; a negative one for all."})),
    row<&filterTag::status>(
        sensibly(kCodeOrAll, {"status", integer, kInt32, optional, "-1",
                              "The filter holds for events of this status; a negative one for all."})),
});

constexpr auto kCountryThresholdKeys = keysOf<CountryThreshold>({
    row<&CountryThreshold::country>(
        {"country", texts, kUnbounded, required, "never used", "Country codes; letter case counts."}),
    row<&CountryThreshold::threshold>({"threshold", real, kShare, required,
                                       "in these countries it refuses every client that requires user info",
                                       "Replaces \"sampling_threshold\" in these countries."}),
});

constexpr auto kClientEntryKeys = keysOf<ClientEntry>({
    row<&ClientEntry::client>({"client", names, kUnbounded, optional, "every client",
                               "Names of the clients that the entry is for; letter case is ignored."}),
    row<&ClientEntry::service>({"service", names, kUnbounded, optional, "every service",
                                "Texts of which one must occur in the name of the client's service; letter "
                                "case is ignored."}),
    row<&ClientEntry::expedite>({"expedite", real, kUnbounded, optional, "as the session says",
                                 "0 batches events, any other number posts each at once."}),
    row<&ClientEntry::hierarchy>(
        sensibly(kFromZero, {"hierarchy", integer, kInt32, optional, "0",
                             "Level of the session among those of the same client and service; 0 is the "
                             "root."})),
    row<&ClientEntry::overrideDNU>({"override_dnu", integer, kInt32, optional, "0",
                                    "1 reports without the user's consent, too; any other number does not."}),
    row<&ClientEntry::localeWhitelist>({"locale_whitelist", texts, kUnbounded, required, kRefusesEveryone,
                                        "Texts of which one must occur in the country code of the locale."}),
    row<&ClientEntry::deviceWhitelist>({"device_whitelist", texts, kUnbounded, optional, "every device",
                                        "Texts of which one must occur in the product family."}),
    row<&ClientEntry::deviceBlacklist>({"device_blacklist", texts, kUnbounded, optional, "no device",
                                        "Texts of which none may occur in the hardware type."}),
    row<&ClientEntry::filters>(
        {"filters", dictionaries, kUnbounded, required, kRefusesEveryone,
         "Which event fields are kept, removed or hashed; the first filter that fits a "
         "field decides.",
         &filterTag::kKeys}),
    row<&ClientEntry::samplingThreshold>(
        {"sampling_threshold", real, kShare, optional,
         "refuses every client that requires user info, but for the countries that have their own",
         "Share of the back ends that report."}),
    row<&ClientEntry::perCountrySamplingThresholds>(
        {"per_country_sampling_thresholds", dictionaries, kUnbounded, optional,
         "the same threshold everywhere",
         "Thresholds of single countries; the first that names the country of the locale counts.",
         &CountryThreshold::kKeys}),
    row<&ClientEntry::overrideSampling>({"override_sampling", real, kShare, optional, "1",
                                         "Up to this share, back ends that are sampled out hold their events "
                                         "instead of being disabled."}),
    row<&ClientEntry::eventThreshold>({"event_threshold", integer, kInt32, optional, "0",
                                       "Number of batched events of a method above which the batch is "
                                       "flushed."}),
    row<&ClientEntry::extrasOnInternal>({"extras_on_internal", integer, kInt32, optional, "0",
                                         "Not 0: on internal builds the client identifier is that of the "
                                         "device."}),
    row<&ClientEntry::customClientID>({"custom_clientId", presence, kUnbounded, optional,
                                       "the identifier of the device's installation",
                                       "The client identifier is one of the client and service."}),
    row<&ClientEntry::postURL>(
        {"post_url", url, kUnbounded, required, "nothing can be posted", "Where events are posted."}),
    row<&ClientEntry::realtimePostURL>({"realtime_post_url", url, kUnbounded, optional,
                                        "that of \"post_url\"", "Where realtime events are posted."}),
});

}  // namespace

constinit const KeyTable filterTag::kKeys{kFilterKeys};
constinit const KeyTable CountryThreshold::kKeys{kCountryThresholdKeys};
constinit const KeyTable ClientEntry::kKeys{kClientEntryKeys};

void take(const Key&, const Value& value, FilterAction& field) {
  const std::string* text = value.asString();
  for (const auto& [name, action] : kFilterActions) {
    if (text != nullptr && *text == name) field = action;
  }
}

void take(const Key&, const Value& value, std::optional<Filters>& field) {
  const Array* array = value.asArray();
  if (array == nullptr) return;
  field = Filters{array->size(), {}};
  for (const Value& element : *array) {
    const Dictionary* dictionary = element.asDictionary();
    if (dictionary == nullptr) continue;
    auto filter = parsed<filterTag>(*dictionary);
    if (filter.key) field->ofKey[lowerCase(*filter.key)].push_back(std::move(filter));
  }
}

}  // namespace veltrad::config
