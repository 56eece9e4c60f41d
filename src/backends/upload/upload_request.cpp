// SPDX-License-Identifier: Apache-2.0
// Makes the address and the headers of an upload.
#include "backends/upload/upload_request.h"

#include <fmt/printf.h>

#include "base/text.h"

namespace veltrad::backends {

namespace {

constexpr std::uint32_t kLeastBytesPerSecond = 1024;
// The answer is written to the log.
constexpr std::size_t kMostAnswerBytes = 1u << 20;
constexpr std::string_view kDescription = "Callwyn QBSL log";

// Besides letters, digits and "-._~" (RFC 3986, 3.4).
constexpr std::string_view kKeptInQuery = "!$&'()*+,;=:@/?";

// Whether all characters may occur in a URL. The HTTP client checks the rest.
bool mayBeURL(std::string_view text) {
  return percentEncoded(text, std::string(kKeptInQuery) + "%#[]") == text;
}

}  // namespace

std::string_view lastPathComponent(std::string_view path) {
  const std::size_t end = path.find_last_not_of('/');
  if (end == std::string_view::npos) return path.substr(0, 1);
  path = path.substr(0, end + 1);
  return path.substr(path.rfind('/') + 1);
}

std::optional<http::HTTPRequest> uploadRequest(const std::string& uploadURL, const std::string& udid,
                                               std::uint32_t sessionID, std::string_view path) {
  const std::string name = std::string(lastPathComponent(path)) + ".gz";
  http::HTTPRequest request;
  request.url = fmt::sprintf(
      "%s?uuid=%s&sequence=%u&description=%s%%20(Uploaded%%20by%%20PKV)&filename=%s&raw=true", uploadURL,
      udid, sessionID, percentEncoded(kDescription, kKeptInQuery), percentEncoded(name, kKeptInQuery));
  if (uploadURL.empty() || !mayBeURL(request.url)) return std::nullopt;
  request.method = http::HTTPRequest::Method::post;
  request.lane = http::HTTPRequest::Lane::upload;
  request.headers = {{"Content-Type", "application/octet-stream"}, {"Content-Encoding", "gzip"}};
  request.leastBytesPerSecond = kLeastBytesPerSecond;
  request.mostResponseBytes = kMostAnswerBytes;
  return request;
}

}  // namespace veltrad::backends
