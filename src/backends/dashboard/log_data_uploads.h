// The uploads of log data arrays: each blocks its caller's thread until the server has answered. Any thread.
#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "base/mutex.h"
#include "base/result.h"
#include "base/value.h"

namespace veltrad {

namespace platform {
class HTTPClient;
}

// One for all dashboard back ends, which it outlives, so that many clients at once do not fill the memory.
class LogDataUploads {
 public:
  // Of archives under way; a single one may be larger.
  static constexpr std::size_t kMostBytes = 64u << 20;

  explicit LogDataUploads(platform::HTTPClient& http) : _http(http) {}

  // Where the server says that it stored the array, whatever its status; none, after one error line, when it
  // could not be asked or said nothing.
  std::optional<std::string> upload(const std::optional<std::string>& postURL, const Array& logData);

 private:
  // The answer's body, or why there is none.
  Result<std::string, std::string> post(const std::string& url, std::string archive);
  bool reserve(std::size_t bytes);
  void release(std::size_t bytes);

  platform::HTTPClient& _http;
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::size_t _bytesUnderWay GUARDED_BY(_mutex) = 0;
};

}  // namespace veltrad
