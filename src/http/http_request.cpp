// SPDX-License-Identifier: Apache-2.0
// The memory of a request, and the headers of an answer. Any thread.
#include "base/text.h"
#include "base/value.h"
#include "http/http_client.h"

namespace veltrad::http {

std::optional<std::string_view> HTTPResponse::header(std::string_view name) const {
  for (const auto& [key, value] : headers) {
    if (equalIgnoringCase(key, name)) return value;
  }
  return std::nullopt;
}

std::size_t keptBytes(const HTTPRequest& request) {
  // The transfer with its list entries, and the two copies of each header.
  constexpr std::size_t kTransfer = 1536, kCopies = 2, kHeader = 96;
  std::size_t bytes = kTransfer + 2 * request.url.capacity() + blockBytes(request.body.capacity());
  if (request.sharedBody) bytes += blockBytes(request.sharedBody->capacity());
  for (const auto& [name, value] : request.headers) {
    bytes += kHeader + kCopies * (name.capacity() + value.capacity());
  }
  return bytes;
}

}  // namespace veltrad::http
