// Downloads one storebag and verifies its signature. Runs on the caller's thread and blocks it for the
// exchange.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"
#include "config/storebag_source.h"

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

struct WholeStorebagAnswer : StorebagAnswer {
  Dictionary storebag;  // verified, where it was fetched
};

// Keeps no state between calls; any number of threads at once. What the constructor takes must outlive it.
class StorebagDownload {
 public:
  StorebagDownload(http::HTTPClient& http, ProcessSettings& settings, const support::Veltra& veltra);

  // `lastModified`, the "Last-Modified" text of the copy
  // that the caller holds, makes the request conditional.
  WholeStorebagAnswer fetchStorebagWithName(const std::string& name,
                                            const std::optional<std::string>& lastModified);

 private:
  struct Refusal {
    StorebagCause cause;  // noAttempt: the key is out of reach just now
    std::string why;
    std::optional<bool> genuine;  // as in StorebagAnswer
  };

  WholeStorebagAnswer withoutAnswer(const std::string& name, const std::string& server,
                                    const http::HTTPError& error) const;
  Result<Dictionary, Refusal> verifiedStorebag(std::string_view body) const;

  http::HTTPClient& _http;
  ProcessSettings& _settings;
  const support::Veltra& _veltra;
};

}  // namespace veltrad::config
