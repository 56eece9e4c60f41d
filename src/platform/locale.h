// The current locale's country and the local time zone's offset. Any thread.
#pragma once

#include <optional>
#include <string>

#include "base/mutex.h"

namespace veltrad::platform {

class FileStore;

class Locale {
 public:
  virtual ~Locale() = default;
  // "DE" for "de_DE.UTF-8"; nothing for "C", "POSIX" and names without a country.
  virtual std::optional<std::string> countryCode() = 0;
  // Seconds east of GMT, now, daylight saving included.
  virtual int timeZoneOffset() = 0;
};

// The first that is set and not empty of LC_ALL, LC_MESSAGES, LANG, then "LANG" in the locale.conf given,
// which is as it last was while it cannot be read for a shortage.
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
};

// The country part of a locale name; exposed for its table of tests.
std::optional<std::string> countryOfLocaleName(const std::string& name);

}  // namespace veltrad::platform
