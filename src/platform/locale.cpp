// SPDX-License-Identifier: Apache-2.0
// Country and time zone from the environment, which does not change after the start.
#include "platform/locale.h"

#include <time.h>

#include <cstdlib>
#include <string_view>

#include "platform/environment_file.h"
#include "platform/file_store.h"

namespace veltrad::platform {

namespace {

bool isLetter(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
}
bool isDigit(char c) {
  return c >= '0' && c <= '9';
}
char upperCase(char c) {
  return c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c;
}

}  // namespace

// LANGUAGE[_COUNTRY][.CODESET][@MODIFIER]; a country is two letters (ISO 3166) or three digits (UN M.49).
std::optional<std::string> countryOfLocaleName(const std::string& name) {
  const auto underscore = name.find('_');
  if (underscore == std::string::npos || underscore == 0) return std::nullopt;
  const auto end = name.find_first_of(".@", underscore);
  if (name.find_first_of(".@") < underscore) return std::nullopt;
  std::string country = name.substr(underscore + 1, end == std::string::npos ? end : end - underscore - 1);
  const bool letters = country.size() == 2 && isLetter(country[0]) && isLetter(country[1]);
  const bool digits =
      country.size() == 3 && isDigit(country[0]) && isDigit(country[1]) && isDigit(country[2]);
  if (!letters && !digits) return std::nullopt;
  for (char& c : country) c = upperCase(c);
  return country;
}

EnvironmentLocale::EnvironmentLocale(FileStore& files, std::string localeConfigurationPath)
    : _files(files), _path(std::move(localeConfigurationPath)) {}

std::optional<std::string> EnvironmentLocale::countryCode() {
  for (const char* variable : {"LC_ALL", "LC_MESSAGES", "LANG"}) {
    const char* name = std::getenv(variable);
    if (name && *name) return countryOfLocaleName(name);
  }
  const auto configuration = _files.read(_path, 64u << 10);
  const Lock lock(_mutex);
  if (configuration) {
    _last = valueInEnvironmentFile(configuration.value(), "LANG");
  } else if (!configuration.error().passes()) {
    _last.reset();
  }
  return _last ? countryOfLocaleName(*_last) : std::nullopt;
}

// Looks for a changed zone once a second, because tzset() asks the file system each time.
int EnvironmentLocale::timeZoneOffset() {
  const time_t now = ::time(nullptr);
  const auto second = static_cast<std::uint32_t>(now);
  const std::uint64_t known = _offset.load(std::memory_order_relaxed);
  if (known >> 32 == second) return static_cast<std::int32_t>(known);
  ::tzset();  // localtime_r does not notice a changed zone
  tm parts{};
  ::localtime_r(&now, &parts);
  const auto offset = static_cast<std::int32_t>(parts.tm_gmtoff);
  _offset.store(std::uint64_t{second} << 32 | static_cast<std::uint32_t>(offset), std::memory_order_relaxed);
  return offset;
}

}  // namespace veltrad::platform
