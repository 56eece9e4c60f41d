// SPDX-License-Identifier: Apache-2.0
// The keys of settings.json, and which of its contents holds. Any thread.
#include "config/operator_settings.h"

#include <utility>

#include "config/settings_check.h"
#include "platform/log.h"

namespace veltrad::config {
namespace {

using enum KeyType;
using enum Need;

// A key without effect in this version.
constexpr Key later(const char* name, KeyType type, Range range, const char* byDefault, const char* meaning,
                    const char* choices = nullptr) {
  Key key{name, type, range, optional, byDefault, meaning};
  key.choices = choices;
  return key;
}
constexpr Key later(const char* name, const KeyTable& inner, const char* byDefault, const char* meaning) {
  return {name, dictionary, kUnbounded, optional, byDefault, meaning, &inner};
}

constexpr double kMostBytes = 1e15;
constexpr Range kBytes{1, kMostBytes};
constexpr Range kDays{1, 36'500};
constexpr Range kSeconds{1, 31'536'000};

constexpr std::array kStorebagChoiceKeys{
    row<&StorebagChoices::persist>(
        {"persist", boolean, kUnbounded, optional, "false",
         "Keeps the last good storebag of each name on disk and verifies it again after a restart."})
        .key,
    later("rollback", choice, kUnbounded, "a lower \"serial\" is taken",
          "Refuses a storebag whose \"serial\" is lower than the highest seen for its name.", "refuse"),
    later("expiry", choice, kUnbounded, "\"expires\" is not looked at",
          "Refuses a storebag past its \"expires\" date.", "honour"),
    later("names", choice, kUnbounded, "\"name\" is not looked at",
          "Refuses a storebag whose \"name\" is not the one asked for.", "check"),
    later("signature", choice, kUnbounded, "the RSA signature suffices",
          "Asks for a good Ed25519 signature as well.", "ed25519"),
    later("openSessions", choice, kUnbounded, "a session keeps the section of its start",
          "Gives open sessions the new section of a storebag that changed.", "follow"),
};

constexpr std::array kFatesKeys{
    row<&FatesChoices::bytes>({"bytes",
                               integer,
                               {64 << 10, 256 << 20},
                               optional,
                               "524288",
                               "Size of the ring that keeps what became of messages. Read at start."})
        .key,
};

constexpr std::array kSpoolKeys{
    later("bytes", integer, kBytes, "no spool", "Bytes of failed posts that are kept on disk."),
    later("days", real, kDays, "no spool", "Days for which a failed post is kept."),
    later("perUser", integer, kBytes, "no bound", "Bytes of one user's failed posts."),
    later("postsPerSecond", real, {0.001, 1'000}, "4", "Kept posts that are sent again in a second."),
    later("firstWait", real, kSeconds, "30", "Seconds before a failed post is sent again."),
    later("longestWait", real, kSeconds, "900", "Seconds that the wait grows to."),
};
constexpr KeyTable kSpoolTable{kSpoolKeys};

constexpr std::array kCompressionKeys{
    row<&CompressionChoices::level>(
        {"level", integer, {0, 9}, optional, "6", "zlib's level for event posts; 0: plain bodies."})
        .key,
};

constexpr Key sampling() {
  Key key =
      row<&OperatorChoices::sampling>(
          {"sampling", choice, kUnbounded, optional, "drawn",
           "How a back end comes by its sampling factor: drawn at random, or derived from a secret of the "
           "device, the storebag's name and its own, and so the same after every start."})
          .key;
  key.choices = "drawn|stable";
  return key;
}

constexpr std::array kSettingsKeys{
    sampling(),
    row<&OperatorChoices::storebags>({"storebags", dictionary, kUnbounded, optional, "none of them",
                                      "What is done with storebags.", &StorebagChoices::kKeys})
        .key,
    later("keys", texts, kUnbounded, "publicKey.der alone", "Files of further public keys under keys/."),
    row<&OperatorChoices::fates>({"fates", dictionary, kUnbounded, optional, "as its keys say",
                                  "The record of what became of messages.", &FatesChoices::kKeys})
        .key,
    later("spool", kSpoolTable, "no spool", "Failed posts are kept on disk and sent again."),
    row<&OperatorChoices::compression>({"compression", dictionary, kUnbounded, optional, "as its keys say",
                                        "How event posts are compressed.", &CompressionChoices::kKeys})
        .key,
    later("jitter", real, {0, 1}, "0", "Share by which refresh cycles and waits are spread, per device."),
};

}  // namespace

constinit const KeyTable StorebagChoices::kKeys{kStorebagChoiceKeys};
constinit const KeyTable FatesChoices::kKeys{kFatesKeys};
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

void take(const Key&, const Value& value, Sampling& field) {
  const std::string* text = value.asString();
  field = text && *text == "stable" ? Sampling::stable : Sampling::drawn;
}

// Logged once the lock is released.
struct OperatorSettings::Said {
  std::optional<std::string> error;
  std::vector<std::string> warnings;
  bool lastStands = false;

  void log() const {
    if (error && lastStands) logError("Settings could not be read, the last ones stand: %s", error->c_str());
    if (error && !lastStands)
      logError("Settings could not be read, no storebag is accepted: %s", error->c_str());
    for (const std::string& warning : warnings) logWarning("Settings: %s", warning.c_str());
  }
};

OperatorSettings::OperatorSettings(platform::FileStore& files, const std::string& path)
    : _file(files, path) {}

std::shared_ptr<const OperatorChoices> OperatorSettings::current() {
  Said said;
  std::shared_ptr<const OperatorChoices> now;
  {
    const Lock held(_mutex);
    refresh(said);
    now = _choices;
  }
  said.log();
  return now;
}

void OperatorSettings::readAgain() {
  {
    const Lock held(_mutex);
    _file.readAgain();
  }
  static_cast<void>(current());
}

void OperatorSettings::refresh(Said& said) {
  using Kind = platform::LocalContent::Kind;
  auto now = _file.content();
  if (!now || now.value() == _content) return;
  _content = std::move(now).value();
  if (_content->warning) said.warnings.push_back(*_content->warning);
  if (_content->kind == Kind::absent) {
    _choices = std::make_shared<const OperatorChoices>();
    return;
  }
  SettingsFindings found;
  if (_content->kind == Kind::broken) {
    found.error = _content->error;
  } else {
    found = checkSettings(*_content, OperatorChoices::kKeys);
  }
  said.error = std::move(found.error);
  said.lastStands = _choices != nullptr;
  said.warnings.insert(said.warnings.end(), found.warnings.begin(), found.warnings.end());
  if (!said.error)
    _choices =
        std::make_shared<const OperatorChoices>(parsed<OperatorChoices>(*_content->value.asDictionary()));
}

}  // namespace veltrad::config
