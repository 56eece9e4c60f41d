// SPDX-License-Identifier: Apache-2.0
// Makes the headers and the body of a post.
#include "backends/https/post_request.h"

#include <fmt/format.h>

#include "backends/https/event.h"
#include "wire/constants.h"

namespace veltrad::backends {

namespace {
std::string shown(const std::optional<std::string>& text) {
  return text ? *text : "(null)";
}
}  // namespace

http::HTTPRequest makePostRequest(const SessionFacts& facts, std::string url, const PostText& text,
                                  std::optional<EventMap> eventMap, BodyCompression compression) {
  http::HTTPRequest request;
  request.method = http::HTTPRequest::Method::post;
  request.lane = http::HTTPRequest::Lane::event;
  request.url = std::move(url);
  request.keepsAnswer = false;

  std::optional<std::string> compressed;
  if (compression.level > 0) compressed = compression.gzip.gzipDeflate(text.pieces(), compression.level);
  const bool useCompressed = compressed && !compressed->empty() && compressed->size() < text.size();
  request.body = useCompressed ? std::move(*compressed) : text.joined();

  auto& headers = request.headers;
  if (const SharedDictionary& userInfo = facts.sentUserInfo) {
    if (const std::string* name = userInfo->string(wire::kVeltraUserInfoClientName)) {
      headers.emplace_back("X-VLT-Client-Name", *name);
    }
    if (const std::string* name = userInfo->string(wire::kVeltraUserInfoServiceName)) {
      headers.emplace_back("X-VLT-Service-Name", *name);
    }
  }
  if (facts.device.isInternal) headers.emplace_back("X-VLT-Internal-Build", "1");
  headers.emplace_back("User-Agent",
                       fmt::format("Veltra/{}.{} ({}; {})", facts.selfVersion.major, facts.selfVersion.minor,
                                   shown(facts.device.hardwareType), shown(facts.device.productVersion)));
  headers.emplace_back("X-VLT-Client-Version", fmt::format("{}", facts.clientVersion));
  headers.emplace_back("X-VLT-Sender", senderCode(facts.compType));
  if (eventMap) {
    headers.emplace_back("X-VLT-Event-Map", fmt::format("{} {}", eventMap->method, eventMap->responseCode));
  }
  headers.emplace_back("Accept", "application/json");
  headers.emplace_back("Content-Type", "application/json");
  headers.emplace_back("Content-Length", fmt::format("{}", request.body.size()));
  if (useCompressed) headers.emplace_back("Content-Encoding", "gzip");
  return request;
}

PostVerdict verdictOfStatus(int status) {
  switch (status / 100) {
    case 2:
      return {false, wire::Reason::event_posted};
    case 3:
      return {false, wire::Reason::server_redirected};
    case 4:
      return {false, wire::Reason::server_refused};
    case 5:
      return {true, wire::Reason::server_error};
    default:
      return {false, wire::Reason::server_status_unknown};
  }
}

}  // namespace veltrad::backends
