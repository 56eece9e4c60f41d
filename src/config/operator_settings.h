// SPDX-License-Identifier: Apache-2.0
// etc/veltrad/settings.json: the operator's settings for a fleet. Any thread; the file is read again after a
// change.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "config/key_table.h"
#include "config/settings_follower.h"

namespace veltrad::config {

// A setting with one allowed value, which enables it.
struct Chosen {
  bool on = false;
  operator bool() const { return on; }
};
void take(const Key& key, const Value& value, Chosen& field);

// "storebags". What each means is written at its key.
struct StorebagChoices {
  bool persist = false;  // the last good section of each name survives a restart
  Chosen rollback;
  Chosen expiry;
  Chosen names;
  Chosen ed25519;
  Chosen follow;

  static const KeyTable kKeys;
};
void take(const Key& key, const Value& value, StorebagChoices& field);

// "compression".
struct CompressionChoices {
  std::int32_t level = 6;  // zlib's, for event posts; 0: plain bodies

  static const KeyTable kKeys;
};
void take(const Key& key, const Value& value, CompressionChoices& field);

// "fates".
struct FatesChoices {
  std::int32_t bytes = 512 << 10;  // of the ring

  static const KeyTable kKeys;
};
void take(const Key& key, const Value& value, FatesChoices& field);

// "spool". Shares and times may be fractions.
struct SpoolChoices {
  std::optional<std::int64_t> bytes = 67'108'864;  // of the files
  std::optional<double> days = 7;
  std::optional<double> perUser = 0.5;  // of `bytes`
  std::optional<double> postsPerSecond = 4;
  std::optional<double> firstWait = 30;  // in seconds
  std::optional<double> longestWait = 900;

  static const KeyTable kKeys;
};
void take(const Key& key, const Value& value, std::optional<SpoolChoices>& field);

// The number of keys that are read from "keys"; further ones are ignored.
inline constexpr std::size_t kMostFurtherKeys = 16;

// The source of a back end's sampling factor.
enum class Sampling { drawn, stable };
void take(const Key& key, const Value& value, Sampling& field);

// The initial values are the defaults without the file.
struct OperatorChoices {
  Sampling sampling = Sampling::drawn;
  StorebagChoices storebags;
  TextList keys;  // files in Root::keysDirectory()
  FatesChoices fates;
  CompressionChoices compression;
  // Absent if failed posts are not kept.
  std::optional<SpoolChoices> spool;
  std::optional<double> jitter = 0;  // a share

  static const KeyTable kKeys;
};

// A file that is broken, unreadable or holds a value of a wrong type or out of its range is logged as one
// error for each change, and the last good content stays in use. Unknown keys, and further elements of
// "keys", are one warning for each change.
class OperatorSettings final : public SettingsFollower<OperatorChoices> {
 public:
  // `path`: of either form. current() is null until the file was good once.
  OperatorSettings(platform::FileStore& files, const std::string& path);
};

}  // namespace veltrad::config
