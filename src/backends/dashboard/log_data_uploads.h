// The uploads of log data arrays: each blocks its caller's thread until the server has answered. Any thread.
#pragma once

#include <optional>
#include <string>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::http {
class HTTPClient;
}  // namespace veltrad::http

namespace veltrad::platform {
class Counters;
}  // namespace veltrad::platform

namespace veltrad::backends {

// One for all dashboard back ends, which it outlives. The memory of the array and its archive is charged with
// the call that brought it.
class LogDataUploads {
 public:
  LogDataUploads(http::HTTPClient& http, platform::Counters& counters) : _http(http), _counters(counters) {}

  // Where the server says that it stored the array, whatever its status; none, after one error line, when it
  // could not be asked or said nothing.
  std::optional<std::string> upload(const std::optional<std::string>& postURL, const Array& logData);

 private:
  // The answer's body, or why there is none.
  Result<std::string, std::string> post(const std::string& url, std::string archive);

  http::HTTPClient& _http;
  platform::Counters& _counters;
};

}  // namespace veltrad::backends
