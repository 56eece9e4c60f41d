// SPDX-License-Identifier: Apache-2.0
// The meaning of a settings file, read again after each change of the file. Any thread.
#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "base/mutex.h"
#include "platform/local_settings.h"
#include "platform/log.h"

namespace veltrad::config {

// Logged once the lock is released.
struct SettingsLines {
  std::vector<std::string> errors;
  std::vector<std::string> warnings;

  void log() const {
    for (const std::string& line : errors) logError("%s", line.c_str());
    for (const std::string& line : warnings) logWarning("%s", line.c_str());
  }
};

// During a shortage the last content stays in use.
template <typename T>
class SettingsFollower {
 public:
  // Interprets a new content, once for each content. `before`: the previous meaning.
  using Meaning = std::shared_ptr<const T> (*)(const platform::LocalContent& content,
                                               const std::shared_ptr<const T>& before, SettingsLines& lines);

  // `path`: of either form. `first` holds until the file could be read. The store must outlive it.
  SettingsFollower(platform::FileStore& files, const std::string& path, Meaning meaning,
                   std::shared_ptr<const T> first)
      : _meaning(meaning), _file(files, path), _now(std::move(first)) {}

  // The current meaning; the same object until it changes.
  std::shared_ptr<const T> current() {
    SettingsLines lines;
    std::shared_ptr<const T> now;
    {
      const Lock held(_mutex);
      auto content = _file.content();
      if (content && content.value() != _content) {
        // Taken over together, or, for lack of memory, at the next call.
        _now = _meaning(*content.value(), _now, lines);
        _content = std::move(content).value();
      }
      now = _now;
    }
    lines.log();
    return now;
  }
  // The same, with the file read now, whether it has changed or not.
  std::shared_ptr<const T> readAgain() {
    {
      const Lock held(_mutex);
      _file.readAgain();
    }
    return current();
  }

 private:
  const Meaning _meaning;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  platform::LocalSettings _file GUARDED_BY(_mutex);
  std::shared_ptr<const platform::LocalContent> _content GUARDED_BY(_mutex);  // null before the first reading
  std::shared_ptr<const T> _now GUARDED_BY(_mutex);
};

}  // namespace veltrad::config
