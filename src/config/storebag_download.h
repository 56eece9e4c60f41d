// Downloads one storebag and verifies its signature. Runs on the caller's thread and blocks it for the
// exchange.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"

namespace veltrad::http {
class HTTPClient;
struct HTTPError;
struct HTTPResponse;
}  // namespace veltrad::http

namespace veltrad::support {
class Veltra;
}  // namespace veltrad::support

namespace veltrad::config {

class ProcessSettings;

// The lifetime in seconds that a "Cache-Control" value allows: the leading integer of the component after the
// first "max-age", components ending at every "=" and every space; kept within 32 bits. 86,400 where there is
// none.
std::int32_t maxAgeOfCacheControl(std::optional<std::string_view> cacheControl);

// What stands in for the storebag "quindle" while its server cannot be reached.
Dictionary defaultStorebag();

// Keeps no state between calls; any number of threads at once. What the constructor takes must outlive it.
class StorebagDownload {
 public:
  StorebagDownload(http::HTTPClient& http, ProcessSettings& settings, const support::Veltra& veltra);

  // The verified storebag, or nothing. `maxAge` (seconds) is written on every path that got an answer;
  // `notModified` becomes true when the server says that the cached storebag is current; `lastModified` (or
  // null), the "Last-Modified" text of the cached storebag, makes the request conditional and is replaced by
  // a new one even when the answer then turns out not to verify. `attempted` becomes false where this was no
  // attempt, of which nothing is to be remembered: for a shortage it could not begin, or its answer not be
  // verified, or the daemon is stopping.
  std::optional<Dictionary> fetchStorebagWithName(const std::string& name, std::int32_t& maxAge,
                                                  bool& notModified, std::optional<std::string>* lastModified,
                                                  bool& attempted);

 private:
  std::optional<Dictionary> withoutAnswer(const std::string& name, const std::string& server,
                                          const http::HTTPError& error, std::int32_t& maxAge,
                                          bool& attempted) const;
  std::optional<Dictionary> verifiedStorebag(std::string_view body, bool& attempted) const;

  http::HTTPClient& _http;
  ProcessSettings& _settings;
  const support::Veltra& _veltra;
};

}  // namespace veltrad::config
