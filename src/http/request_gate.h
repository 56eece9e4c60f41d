// SPDX-License-Identifier: Apache-2.0
// Decides whether a request may leave the device, and counts and records the requests that do. Any thread;
// called before each request begins.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/file_descriptor.h"
#include "base/value.h"
#include "wire/reasons.h"

namespace veltrad::http {

struct RequestRefusal {
  wire::Reason reason;
  // One line, for the error of the request.
  std::string text;
};

// Something that leaves the device: a post of events, a datagram, a file or log data.
struct Departure {
  enum class Kind { post, datagram, file, logData };
  Kind kind = Kind::post;
  // The whole URL, or "udp://IP:PORT".
  std::string to;
  std::uint64_t events = 1;
  // The size of its body.
  std::uint64_t bytes = 0;
  // The client that sent it: {"clientType", "sessionID", "client", "service"}. Null: not known.
  std::shared_ptr<const Dictionary> client;
  // {"backend", "storebag", "entry", "removed", "hashed"}.
  Dictionary about;
};

// How a departure ended.
struct DepartureEnd {
  // The status of the answer; 0 if there is none.
  int status = 0;
  // One line; empty: none.
  std::string error;
  int transmissions = 1;
};

class RequestGate {
 public:
  virtual ~RequestGate() = default;
  // `host`: as the URL has it, without port. Nothing: it may begin.
  virtual std::optional<RequestRefusal> refusal(bool forStorebag, std::string_view host) const = 0;
  // Called once for each request that may begin, except storebag requests: counts it for the owner's daily
  // limits, or refuses it.
  virtual std::optional<RequestRefusal> count(const Departure& departure) = 0;
  // Whether departures are recorded, so that `about` is needed.
  virtual bool keepsRecords() const = 0;
  // False if departures are recorded and there is no room for a record at the moment. Then only storebag
  // requests may begin.
  virtual bool hasRoomForRecord() const = 0;
  // Records a departure that begins now. The body is in `body` or, with so many bytes as the departure says,
  // in `file`. Returns the number of the record; 0: nothing is recorded.
  virtual std::uint64_t record(const Departure& departure, std::vector<std::string> headerLines,
                               std::string_view body, std::shared_ptr<const FileDescriptor> file) = 0;
  // A request that waited, or was about to begin, was refused by the owner's decision.
  virtual void refused(const Departure& departure) = 0;
  // Called once for each record.
  virtual void ended(std::uint64_t record, const DepartureEnd& end) = 0;
};

}  // namespace veltrad::http
