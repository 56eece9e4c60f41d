// SPDX-License-Identifier: Apache-2.0
// Downloads storebags.
#include "config/storebag_download.h"

#include <algorithm>
#include <chrono>
#include <limits>

#include "base/text.h"
#include "config/process_settings.h"
#include "config/storebag_container.h"
#include "config/storebag_trust.h"
#include "http/http_client.h"
#include "platform/log.h"
#include "support/veltra.h"

namespace veltrad::config {
namespace {

constexpr std::chrono::milliseconds kStorebagTimeout{15'000};
constexpr std::int32_t kDefaultMaxAgeSeconds = 86'400;
constexpr const char* kNameWithDefault = "quindle";

// The digits after an optional sign; 0 if there are none. Clamped to 32 bits.
std::int32_t leadingInteger(std::string_view text) {
  constexpr std::int64_t kMost = std::numeric_limits<std::int32_t>::max();
  const bool negative = text.starts_with('-');
  if (negative || text.starts_with('+')) text.remove_prefix(1);
  std::int64_t number = 0;
  for (const char c : text) {
    if (c < '0' || c > '9') break;
    number = std::min(number * 10 + (c - '0'), kMost + 1);
  }
  return static_cast<std::int32_t>(negative ? -number : std::min(number, kMost));
}

http::HTTPRequest requestForStorebag(std::string url, const std::optional<std::string>& lastModified) {
  http::HTTPRequest request;
  request.method = http::HTTPRequest::Method::get;
  request.lane = http::HTTPRequest::Lane::storebag;
  request.url = std::move(url);
  request.timeout = kStorebagTimeout;
  request.mostResponseBytes = kStorebagMostContainerBytes;
  if (lastModified) {
    logDebug("fetchStorebagWithName: Adding 'Last-Modified: %s' to the header", lastModified->c_str());
    request.headers.emplace_back("If-Modified-Since", *lastModified);
  }
  return request;
}

// True if the caller's copy is current; otherwise `lastModified` is set to the answer's text.
bool isNotModified(const http::HTTPResponse& response, std::optional<std::string>& lastModified) {
  const std::optional<std::string_view> header = response.header("Last-Modified");
  if (!header) return false;
  if (response.body.empty() && lastModified) {
    logDebug("fetchStorebagWithName: storebag content has not changed. using its cached version");
    return true;
  }
  lastModified = std::string(*header);
  logDebug("fetchStorebagWithName: New 'Last-Modified: %s' received", lastModified->c_str());
  return false;
}

StorebagCause causeOf(const http::HTTPError& error) {
  using Kind = http::HTTPError::Kind;
  if (error.kind == Kind::tooLarge) return StorebagCause::noStorebag;
  if (error.kind != Kind::transport) return StorebagCause::noAttempt;
  switch (error.cause) {
    case http::HTTPError::Cause::resolve:
      return StorebagCause::resolve;
    case http::HTTPError::Cause::connect:
      return StorebagCause::connect;
    case http::HTTPError::Cause::trust:
      return StorebagCause::trust;
    case http::HTTPError::Cause::timeout:
    case http::HTTPError::Cause::other:
      break;
  }
  return StorebagCause::noAnswer;
}

// All lines of the header, joined.
std::optional<std::string> cacheControlOf(const http::HTTPResponse& response) {
  std::optional<std::string> all;
  for (const auto& [name, value] : response.headers) {
    if (equalIgnoringCase(name, "Cache-Control")) all = all ? *all + ", " + value : value;
  }
  return all;
}

}  // namespace

std::int32_t maxAgeOfCacheControl(std::optional<std::string_view> cacheControl) {
  if (!cacheControl) return kDefaultMaxAgeSeconds;
  std::string_view rest = *cacheControl;
  for (;;) {
    const std::size_t end = rest.find_first_of("= ");
    if (end == std::string_view::npos) return kDefaultMaxAgeSeconds;
    const bool found = rest.substr(0, end) == "max-age";
    rest.remove_prefix(end + 1);
    if (found) return leadingInteger(rest.substr(0, rest.find_first_of("= ")));
  }
}

Dictionary defaultStorebag() {
  const Dictionary section{{"mivo", Dictionary{{"active", true}}}};
  return Dictionary{{"florn_internal", section},
                    {"development", section},
                    {"release", section},
                    {"version", "1.0.0-Quindle-Fallback"},
                    {"refresh_cycle", 3600}};
}

StorebagDownload::StorebagDownload(http::HTTPClient& http, ProcessSettings& settings,
                                   const support::Veltra& veltra, StorebagTrust& trust)
    : _http(http), _settings(settings), _veltra(veltra), _trust(trust) {}

WholeStorebagAnswer StorebagDownload::fetchStorebagWithName(const std::string& name,
                                                            const std::optional<std::string>& lastModified,
                                                            const OperatorChoices& choices) {
  WholeStorebagAnswer answer;
  const auto without = [&](const std::string& server, const http::HTTPError& error) {
    answer = withoutAnswer(name, server, error);
    answer.lastModified = lastModified;
    return answer;
  };
  const std::optional<std::string> server = _settings.storebagServerURL();
  const auto version = _veltra.statedVersion();
  if (!server || !version) {
    const std::string why = version ? "its address cannot be read just now" : version.error().description;
    return without("(null)", {http::HTTPError::Kind::shortage, why});
  }
  const std::string url = *server + "/" + name + "?version=" + version.value();
  logDebug("fetchStorebagWithName: Storebag Server URL: %s", url.c_str());
  http::HTTPResult result = _http.perform(requestForStorebag(url, lastModified));
  if (!result) return without(url, result.error());
  http::HTTPResponse& response = result.value();
  answer.status = response.status;
  answer.maxAge = maxAgeOfCacheControl(cacheControlOf(response));
  answer.lastModified = lastModified;
  if (isNotModified(response, answer.lastModified)) {
    answer.kind = StorebagAnswer::Kind::notModified;
    return answer;
  }
  auto storebag = _trust.accepted(name, response.body, choices);
  if (!storebag) {
    answer.attempted = storebag.error().cause != StorebagCause::noAttempt;
    answer.cause = storebag.error().cause;
    answer.why = std::move(storebag.error().why);
    answer.genuine = storebag.error().genuine;
    answer.refusal = storebag.error().reason;
    return answer;
  }
  answer.genuine = true;
  answer.kind = StorebagAnswer::Kind::fetched;
  answer.storebag = std::move(storebag).value();
  answer.container = std::move(response.body);
  return answer;
}

WholeStorebagAnswer StorebagDownload::withoutAnswer(const std::string& name, const std::string& server,
                                                    const http::HTTPError& error) const {
  using Kind = http::HTTPError::Kind;
  WholeStorebagAnswer answer;
  answer.cause = causeOf(error);
  answer.why = error.description;
  answer.status = error.status;
  if (error.kind == Kind::tooLarge) {  // the server has answered
    answer.maxAge = kDefaultMaxAgeSeconds;
    logError("fetchStorebagWithName: propertyListWithData error %s", error.description.c_str());
    logError("fetchStorebagWithName: Signature is missing");
    return answer;
  }
  answer.attempted =
      error.kind != Kind::shortage && error.kind != Kind::stopping && error.kind != Kind::refused;
  logInfo("fetchStorebagWithName: Error resolving with lookup server %s, sendSynchronousRequest error %s",
          server.c_str(), error.description.c_str());
  if (name != kNameWithDefault || error.kind == Kind::stopping) return answer;
  logInfo("fetchStorebagWithName: Loading default storebag '%s'", name.c_str());
  answer.kind = StorebagAnswer::Kind::fetched;
  answer.storebag = defaultStorebag();
  return answer;
}

}  // namespace veltrad::config
