// SPDX-License-Identifier: Apache-2.0
// Downloads storebags and has StorebagTrust check them. Blocks the caller's thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/value.h"
#include "config/storebag_source.h"

namespace veltrad::http {
class HTTPClient;
struct HTTPError;
}  // namespace veltrad::http

namespace veltrad::support {
class Veltra;
}  // namespace veltrad::support

namespace veltrad::config {

class ProcessSettings;
class StorebagTrust;
struct OperatorChoices;

// The lifetime in seconds by a "Cache-Control" value: the leading integer of the component after the first
// "max-age", where components end at every "=" and every space; clamped to 32 bits. 86,400 if there is none.
std::int32_t maxAgeOfCacheControl(std::optional<std::string_view> cacheControl);

// Replaces the storebag "quindle" while its server cannot be reached.
Dictionary defaultStorebag();

struct WholeStorebagAnswer : StorebagAnswer {
  Dictionary storebag;    // verified, where it was fetched
  std::string container;  // its signed bytes; empty for a default storebag
};

// Keeps no state between calls, so any number of threads may call it. The constructor's arguments must
// outlive it.
class StorebagDownload {
 public:
  StorebagDownload(http::HTTPClient& http, ProcessSettings& settings, const support::Veltra& veltra,
                   StorebagTrust& trust);

  // `lastModified`, the "Last-Modified" text of the caller's copy, makes the request conditional.
  WholeStorebagAnswer fetchStorebagWithName(const std::string& name,
                                            const std::optional<std::string>& lastModified,
                                            const OperatorChoices& choices);

 private:
  WholeStorebagAnswer withoutAnswer(const std::string& name, const std::string& server,
                                    const http::HTTPError& error) const;

  http::HTTPClient& _http;
  ProcessSettings& _settings;
  const support::Veltra& _veltra;
  StorebagTrust& _trust;
};

}  // namespace veltrad::config
