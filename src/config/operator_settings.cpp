// SPDX-License-Identifier: Apache-2.0
// The keys of settings.json, and the choice of the valid content. Any thread.
#include "config/operator_settings.h"

#include <fmt/format.h>

#include "config/choice_row.h"
#include "config/settings_check.h"

namespace veltrad::config {
namespace {

using enum KeyType;
using enum Need;

constexpr Range kRingBytes{64 << 10, 256 << 20};
constexpr Range kSpoolBytes{1 << 20, 1e15};
constexpr Range kPace{0.001, 1'000};
constexpr Range kJitter{0, 1};
constexpr Range kWait{0.05, 86'400};

constexpr auto kStorebagChoiceKeys = keysOf<StorebagChoices>({
    row<&StorebagChoices::persist>(
        {"persist", boolean, kUnbounded, optional, "false",
         "Keeps the last good storebag of each name on disk and verifies it again after a restart."}),
    choiceRow<&StorebagChoices::rollback>(
        "rollback", "refuse", "a lower \"serial\" is taken",
        "Refuses a storebag whose \"serial\" is lower than the highest seen for its name, or missing."),
    choiceRow<&StorebagChoices::expiry>("expiry", "honour", "\"expires\" is not looked at",
                                        "Refuses a storebag past its \"expires\" date and stops using one."),
    choiceRow<&StorebagChoices::names>("names", "check", "\"name\" is not looked at",
                                       "Refuses a storebag whose \"name\" is not the one asked for."),
    choiceRow<&StorebagChoices::ed25519>("signature", "ed25519", "the RSA signature suffices",
                                         "Asks for a good Ed25519 signature by one of \"keys\" as well."),
    choiceRow<&StorebagChoices::follow>("openSessions", "follow", "a session keeps the section of its start",
                                        "Gives open sessions the new section of a storebag that changed."),
});

constexpr auto kFatesKeys = keysOf<FatesChoices>({
    row<&FatesChoices::bytes>({"bytes", integer, kRingBytes, optional, "524288",
                               "Size of the ring that keeps what became of messages. Read at start."}),
});

constexpr auto kSpoolKeys = keysOf<SpoolChoices>({
    row<&SpoolChoices::bytes>({"bytes", integer, kSpoolBytes, optional, "67108864",
                               "Bytes of the files that failed posts are kept in."}),
    row<&SpoolChoices::days>(
        {"days", real, {1e-5, 36'500}, optional, "7", "Days for which a failed post is kept."}),
    row<&SpoolChoices::perUser>(
        {"perUser", real, {0.001, 1}, optional, "0.5", "Share of the bytes that one user id may take."}),
    row<&SpoolChoices::postsPerSecond>(
        {"postsPerSecond", real, kPace, optional, "4", "Kept posts that leave for one address in a second."}),
    row<&SpoolChoices::firstWait>({"firstWait", real, kWait, optional, "30",
                                   "Seconds within which a failing address is tried again, at random."}),
    row<&SpoolChoices::longestWait>({"longestWait", real, kWait, optional, "900",
                                     "Seconds that this grows to: it doubles with each failure."}),
});

constexpr auto kCompressionKeys = keysOf<CompressionChoices>({
    row<&CompressionChoices::level>(
        {"level", integer, {0, 9}, optional, "6", "zlib's level for event posts; 0: plain bodies."}),
});

constexpr auto kSettingsKeys = keysOf<OperatorChoices>({
    choiceRow<&OperatorChoices::sampling>(
        "sampling", "drawn|stable", "drawn",
        "How a back end comes by its sampling factor: drawn at random, or derived from a secret of the "
        "device, the storebag's name and its own, and so the same after every start."),
    row<&OperatorChoices::storebags>({"storebags", dictionary, kUnbounded, optional, "none of them",
                                      "What is done with storebags.", &StorebagChoices::kKeys}),
    row<&OperatorChoices::keys>(
        {"keys", texts, kUnbounded, optional, "publicKey.der alone",
         "Names of files in etc/veltrad/keys with further public keys, RSA or Ed25519, DER or PEM. A "
         "storebag "
         "is taken by any RSA key of them and publicKey.der that no accepted storebag names in "
         "\"revoked\"."}),
    row<&OperatorChoices::fates>({"fates", dictionary, kUnbounded, optional, "as its keys say",
                                  "The record of what became of messages.", &FatesChoices::kKeys}),
    row<&OperatorChoices::spool>({"spool", dictionary, kUnbounded, optional, "no spool",
                                  "Failed posts are kept on disk and sent again. Read at start.",
                                  &SpoolChoices::kKeys}),
    row<&OperatorChoices::compression>({"compression", dictionary, kUnbounded, optional, "as its keys say",
                                        "How event posts are compressed.", &CompressionChoices::kKeys}),
    row<&OperatorChoices::jitter>(
        {"jitter", real, kJitter, optional, "0",
         "Share by which the times between fetches of a storebag are spread, so that devices do not ask at "
         "once: up to that share of its refresh cycle sooner, or of it later than 900 seconds after a "
         "failure. "
         "Each device draws anew for each fetch."}),
});

}  // namespace

constinit const KeyTable StorebagChoices::kKeys{kStorebagChoiceKeys};
constinit const KeyTable FatesChoices::kKeys{kFatesKeys};
constinit const KeyTable SpoolChoices::kKeys{kSpoolKeys};
constinit const KeyTable CompressionChoices::kKeys{kCompressionKeys};
constinit const KeyTable OperatorChoices::kKeys{kSettingsKeys};

void take(const Key&, const Value& value, StorebagChoices& field) {
  if (const Dictionary* dictionary = value.asDictionary()) field = parsed<StorebagChoices>(*dictionary);
}

void take(const Key&, const Value& value, FatesChoices& field) {
  if (const Dictionary* dictionary = value.asDictionary()) field = parsed<FatesChoices>(*dictionary);
}

void take(const Key&, const Value& value, CompressionChoices& field) {
  if (const Dictionary* dictionary = value.asDictionary()) field = parsed<CompressionChoices>(*dictionary);
}

void take(const Key& key, const Value& value, Chosen& field) {
  const std::string* text = value.asString();
  field.on = text && *text == key.choices;
}

void take(const Key&, const Value& value, std::optional<SpoolChoices>& field) {
  if (const Dictionary* dictionary = value.asDictionary()) field = parsed<SpoolChoices>(*dictionary);
}

void take(const Key&, const Value& value, Sampling& field) {
  const std::string* text = value.asString();
  field = text && *text == "stable" ? Sampling::stable : Sampling::drawn;
}

namespace {
std::shared_ptr<const OperatorChoices> choicesIn(const platform::LocalContent& content,
                                                 const std::shared_ptr<const OperatorChoices>& before,
                                                 SettingsLines& lines) {
  using Kind = platform::LocalContent::Kind;
  SettingsFindings found;
  if (content.kind == Kind::broken) found.error = content.error;
  if (content.kind == Kind::good) found = checkSettings(content, OperatorChoices::kKeys);
  if (content.warning) found.warnings.insert(found.warnings.begin(), *content.warning);
  for (const std::string& warning : found.warnings) lines.warnings.push_back("Settings: " + warning);
  if (content.kind == Kind::absent) return std::make_shared<const OperatorChoices>();
  if (!found.error) {
    auto choices =
        std::make_shared<const OperatorChoices>(parsed<OperatorChoices>(*content.value.asDictionary()));
    if (const std::size_t keys = choices->keys.texts.size(); keys > kMostFurtherKeys)
      lines.warnings.push_back(
          fmt::format("Settings: {}: \"keys\" names {} files, of which the first {} are used",
                      content.placeOf({"keys"}), keys, kMostFurtherKeys));
    return choices;
  }
  const char* meanwhile = before ? "the last ones stand: " : "no storebag is accepted: ";
  lines.errors.push_back(std::string("Settings could not be read, ") + meanwhile + *found.error);
  return before;
}
}  // namespace

OperatorSettings::OperatorSettings(platform::FileStore& files, const std::string& path)
    : SettingsFollower(files, path, choicesIn, nullptr) {}

}  // namespace veltrad::config
