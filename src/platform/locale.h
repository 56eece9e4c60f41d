// SPDX-License-Identifier: Apache-2.0
// The country of the current locale, and the offset of the local time zone. Any thread.
#pragma once

#include <atomic>
#include <cstdint>
#include <optional>
#include <string>

#include "base/mutex.h"

namespace veltrad::platform {

class FileStore;

class Locale {
 public:
  virtual ~Locale() = default;
  // "DE" for "de_DE.UTF-8"; absent for "C", "POSIX" and names without a country.
  virtual std::optional<std::string> countryCode() = 0;
  // The current offset in seconds east of GMT, including daylight saving time.
  virtual int timeZoneOffset() = 0;
};

// Uses the first of LC_ALL, LC_MESSAGES and LANG that is set and not empty, else "LANG" in the given
// locale.conf. During a shortage, the value that was last read from the file is used.
class EnvironmentLocale final : public Locale {
 public:
  EnvironmentLocale(FileStore& files, std::string localeConfigurationPath);
  std::optional<std::string> countryCode() override;
  int timeZoneOffset() override;

 private:
  FileStore& _files;
  const std::string _path;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<std::string> _last GUARDED_BY(_mutex);
  // A second since 1970 in the upper half, and the offset in that second in the lower half.
  std::atomic<std::uint64_t> _offset{0};
};

// The country in a locale name. Exposed for tests.
std::optional<std::string> countryOfLocaleName(const std::string& name);

}  // namespace veltrad::platform
