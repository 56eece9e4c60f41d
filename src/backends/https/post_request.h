// The HTTPS request of one post. Plain functions; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "http/http_client.h"
#include "wire/reasons.h"

namespace veltrad::backends {

class VeltraBackend;

// What a single event's post says of it in "X-VLT-Event-Map"; a flush has none.
struct EventMap {
  std::uint16_t method;
  std::uint16_t responseCode;
};

// A POST of the JSON bytes, compressed when that is strictly shorter, with the headers that name the client,
// the sender and the daemon. A text that is absent in "User-Agent" is "(null)".
http::HTTPRequest makePostRequest(const VeltraBackend& backend, std::string url, std::string json,
                                  std::optional<EventMap> eventMap);

// What an answer's status means for the backend and for the events of the post.
struct PostVerdict {
  bool disablesBackend;  // 5xx
  wire::Reason reason;   // of the events' fate
};
PostVerdict verdictOfStatus(int status);

}  // namespace veltrad::backends
