// SPDX-License-Identifier: Apache-2.0
// Devices' requests: which path takes what, and which handler gets the body.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <variant>

#include "base/result.h"
#include "gateway/byte_budget.h"
#include "gateway/http_server.h"
#include "gateway/publisher.h"
#include "gateway/refusals.h"

namespace veltrad::gateway {

// Of bodies, in bytes if nothing else is said.
struct BodyBounds {
  // Events, packed and unpacked; log data.
  std::uint64_t events = 16u << 20;
  std::uint64_t logData = 32u << 20;
  // In number. A device posts at most 4,096 at once; others may post more, but a small gzip stream must not
  // become millions of rows.
  std::uint64_t eventsInOne = 65'536;
  std::uint64_t packedFile = std::uint64_t{2} << 30;
  std::uint64_t unpackedFile = std::uint64_t{4} << 30;
  // What is kept of all until they are answered: of events, and of files and log data, which leaves half of
  // what may be held to events.
  std::uint64_t eventsTogether = 256u << 20;
  std::uint64_t othersTogether = 128u << 20;
};

// Runs a long turn where it keeps nobody waiting, on any thread, now or later.
using Aside = std::function<void(std::function<void()>)>;

// What handlers of bodies use. All of it must outlive them.
struct HandlerServices {
  Publisher& publisher;
  Metrics& metrics;
  Refusals& refusals;
  BodyBounds bounds;
  Aside aside;
};

enum class Place { events, upload, logData };
// What a request wants, decided from its head alone.
struct ParsedRequest {
  Place place;
  std::string path;
  // The label behind "/events/".
  std::string via;
  // X-VLT-Post-ID; empty if the device has sent none.
  std::string postID;
  // Decoded parameters.
  std::map<std::string, std::string> query;
  bool packed = false;
  // Of the body, where the head says it.
  std::optional<std::uint64_t> length;
};
Result<ParsedRequest, Refusal> parsedRequest(const RequestHead& head, const BodyBounds& bounds);

// On the server's thread.
class RequestRouter {
 public:
  RequestRouter(Publisher& publisher, Metrics& metrics, BodyBounds bounds, int shed, Aside aside)
      : _refusals(publisher, metrics, shed),
        _events(bounds.eventsTogether),
        _others(bounds.othersTogether),
        _services{publisher, metrics, _refusals, bounds, std::move(aside)} {}

  std::variant<Answer, std::unique_ptr<BodyHandler>> request(const RequestHead& head);

 private:
  Refusals _refusals;
  ByteBudget _events;
  ByteBudget _others;
  const HandlerServices _services;
};

}  // namespace veltrad::gateway
