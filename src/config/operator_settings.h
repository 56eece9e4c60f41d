// SPDX-License-Identifier: Apache-2.0
// etc/veltrad/settings.json: what an operator chooses for the fleet. Any thread; the file is reread when it
// changed.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "base/mutex.h"
#include "config/key_table.h"
#include "platform/local_settings.h"

namespace veltrad::config {

// "storebags".
struct StorebagChoices {
  bool persist = false;  // the last good section of each name survives a restart

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

// How a back end comes by its sampling factor.
enum class Sampling { drawn, stable };
void take(const Key& key, const Value& value, Sampling& field);

// What holds without the file stands here; the table has keys of later versions too, which are checked and
// have no effect.
struct OperatorChoices {
  Sampling sampling = Sampling::drawn;
  StorebagChoices storebags;
  FatesChoices fates;
  CompressionChoices compression;

  static const KeyTable kKeys;
};

// A file that is broken, unreadable or holds a value of a wrong type or out of its range is one error line a
// change, and the last good content stands. A key that is unknown or has no effect is one warning a change.
class OperatorSettings {
 public:
  // `path`: of either form.
  OperatorSettings(platform::FileStore& files, const std::string& path);

  // What holds now; null: the file has never been good, or cannot be read just now and was not yet.
  std::shared_ptr<const OperatorChoices> current();
  // Reads the file now, whether it has changed or not.
  void readAgain();

 private:
  struct Said;
  void refresh(Said& said) REQUIRES(_mutex);

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  platform::LocalSettings _file GUARDED_BY(_mutex);
  std::shared_ptr<const platform::LocalContent> _content GUARDED_BY(_mutex);  // null before the first reading
  std::shared_ptr<const OperatorChoices> _choices GUARDED_BY(_mutex);         // null while there are none
};

}  // namespace veltrad::config
