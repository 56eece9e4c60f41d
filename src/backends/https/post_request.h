// SPDX-License-Identifier: Apache-2.0
// Makes the HTTPS request of a post and evaluates the status of its answer.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "backends/https/json_message.h"
#include "http/http_client.h"
#include "support/gzip.h"
#include "wire/reasons.h"

namespace veltrad::backends {

struct SessionFacts;

// The content of "X-VLT-Event-Map", for a post of a single event only.
struct EventMap {
  std::uint16_t method;
  std::uint16_t responseCode;
};

// How a body is compressed: `level` is zlib's, 0 to 9, and 0 leaves it plain.
struct BodyCompression {
  support::GzipCompressor& gzip;
  int level;
};

// Compresses the text if that makes it shorter. In "User-Agent", "(null)" stands for an absent text.
http::HTTPRequest makePostRequest(const SessionFacts& facts, std::string url, const PostText& text,
                                  std::optional<EventMap> eventMap, BodyCompression compression);

// The meaning of an answer's status for the back end and the posted events.
struct PostVerdict {
  bool disablesBackend;
  wire::Reason reason;
};
PostVerdict verdictOfStatus(int status);

}  // namespace veltrad::backends
