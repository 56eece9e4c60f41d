// SPDX-License-Identifier: Apache-2.0
// The tables of the keys of a storebag, its sections and its back ends.
#include "config/storebag_content.h"

#include "wire/constants.h"

namespace veltrad::config {
namespace {

using enum KeyType;
using enum Need;

constexpr Range kPort{0, 65'535};
constexpr Range kRefreshCycle{kInt32.least, 86'400};
constexpr Range kSerial{0, 9'007'199'254'740'991.0};  // what every reader of JSON takes exactly

constexpr auto kHTTPSPostKeys = keysOf<HTTPSPostProfile>({
    row<&HTTPSPostProfile::displayURL>(
        {"display_url", text, kUnbounded, optional, "none", "Address that clients may show to their user."}),
    row<&HTTPSPostProfile::clients>(
        {"clients", dictionaries, kUnbounded, required, "the back end is left out",
         "Client entries; the first that fits the client counts.", &ClientEntry::kKeys}),
});

constexpr auto kDashboardKeys = keysOf<DashboardProfile>({
    row<&DashboardProfile::ip>({"ip", text, kUnbounded, required, "the back end is left out",
                                "IPv4 address of the server, in decimal."}),
    row<&DashboardProfile::port>(
        sensibly({1, kPort.most},
                 {"port", integer, kPort, required, "the back end is left out", "UDP port of the server."})),
    row<&DashboardProfile::displayURL>(
        {"display_url", text, kUnbounded, optional, "none", "Address that clients may show to their user."}),
    row<&DashboardProfile::postURL>(
        {"post_url", url, kUnbounded, optional, "log data is not uploaded", "Where log data is posted."}),
    row<&DashboardProfile::reliable>(sensibly(
        {50, kInt32.most}, {"reliable", presence, kInt32, optional, "without acknowledgements",
                            "Any value switches acknowledgements and retransmission on; a number "
                            "from 1 on is the period of the timer in milliseconds, else it is 500."})),
});

constexpr auto kUploadKeys = keysOf<UploadProfile>({
    row<&UploadProfile::postURL>({"post_url", url, kUnbounded, required, "the back end is left out",
                                  "Where files are uploaded to; without a query."}),
    row<&UploadProfile::displayURL>(
        {"display_url", text, kUnbounded, optional, "none", "Address that clients may show to their user."}),
});

// The daemon does not read these entries.
constexpr std::array<Key, 1> kMarkKeys{Key{"active", presence, kUnbounded, optional, "nothing",
                                           "Marks the entry for the reader; it has no effect."}};
constexpr KeyTable kMarkTable{kMarkKeys};

template <typename Parsed>
constexpr Row<StorebagSection> profile(const char* name, const char* meaning) {
  Row<StorebagSection> row{
      {name, dictionary, kUnbounded, optional, "no such back end", meaning, &Parsed::kKeys}};
  row.key.read = [](const Key& key, const Value& value, void* section) {
    const Dictionary* content = value.asDictionary();
    if (content == nullptr) return;
    static_cast<StorebagSection*>(section)->backends[key.name] =
        std::make_shared<const Profile>(parsed<Parsed>(*content));
  };
  return row;
}

constexpr auto kSectionKeys = keysOf<StorebagSection>({
    profile<DashboardProfile>(wire::kVeltraBackendDashboard, "Sends messages as datagrams to a dashboard."),
    profile<UploadProfile>(wire::kVeltraBackendUploadServer, "Uploads the files of clients."),
    profile<HTTPSPostProfile>(wire::kVeltraBackendHTTPPost, "Posts messages as JSON events."),
    profile<HTTPSPostProfile>(wire::kVeltraBackendHTTPPost2, "Posts messages to a second collector."),
    {{wire::kVeltraBackendAmpery, dictionary, kUnbounded, optional, "no such back end",
      "Writes messages to the energy log.", &kMarkTable}},
    {{wire::kVeltraBackendMivo, dictionary, kUnbounded, optional, "no such back end",
      "Hands messages to the adaptor bundle.", &kMarkTable}},
});

constexpr auto kStorebagKeys = keysOf<Storebag>({
    row<&Storebag::version>({"version", text, kUnbounded, required, "events do not say which they follow",
                             "Text that names this state of the storebag in events."}),
    row<&Storebag::refreshCycle>(
        sensibly({0, kRefreshCycle.most},
                 {"refresh_cycle", integer, kRefreshCycle, optional, "what the server's Cache-Control says",
                  "Seconds for which a fetched storebag stays fresh."})),
    row<&Storebag::serial>(
        {"serial", integer, kSerial, optional, "none",
         "Number that grows with each state of the storebag. Read with {\"rollback\": \"refuse\"}."}),
    row<&Storebag::expires>({"expires", text, kUnbounded, optional, "it never expires",
                             "Date, whose end counts, or date and time (RFC 3339) after which it is not to "
                             "be used. Read with {\"expiry\": \"honour\"}."}),
    row<&Storebag::name>({"name", text, kUnbounded, optional, "none",
                          "Name that the storebag is served under. Read with {\"names\": \"check\"}."}),
    {{"revoked", texts, kUnbounded, optional, "none",
      "SHA-256 digests (64 hexadecimal digits) of public keys that are no longer to be taken. Read with "
      "\"keys\"."}},
    row<&Storebag::development>({"development", dictionary, kUnbounded, optional, "no back ends there",
                                 "Back ends of the development environment.", &StorebagSection::kKeys}),
    row<&Storebag::flornInternal>({"florn_internal", dictionary, kUnbounded, optional, "no back ends there",
                                   "Back ends of the internal environment.", &StorebagSection::kKeys}),
    row<&Storebag::seed>({"seed", dictionary, kUnbounded, optional, "the section \"release\"",
                          "Back ends of the seed environment.", &StorebagSection::kKeys}),
    row<&Storebag::release>({"release", dictionary, kUnbounded, required,
                             "most devices get nothing, and those of \"seed\" have nothing to fall back on",
                             "Back ends of the release environment.", &StorebagSection::kKeys}),
});

}  // namespace

constinit const KeyTable HTTPSPostProfile::kKeys{kHTTPSPostKeys};
constinit const KeyTable DashboardProfile::kKeys{kDashboardKeys};
constinit const KeyTable UploadProfile::kKeys{kUploadKeys};
constinit const KeyTable StorebagSection::kKeys{kSectionKeys};
constinit const KeyTable Storebag::kKeys{kStorebagKeys};

void take(const Key&, const Value& value, Reliable& field) {
  field = {true, value.toInt32().value_or(0)};
}

std::shared_ptr<const StorebagSection> parseSection(const Dictionary& section, StorebagOrigin origin) {
  auto made = std::make_shared<StorebagSection>();
  made->origin = std::move(origin);
  made->asGiven = section;
  for (const auto& [name, value] : section) made->backends.emplace(name, nullptr);
  readKeys(StorebagSection::kKeys, section, made.get());
  return made;
}

}  // namespace veltrad::config
