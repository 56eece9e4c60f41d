// The posts of events: from the events to their message, from its answer to their fate. Any thread; answers
// come on the HTTP thread.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/backend.h"
#include "backends/https/json_message.h"
#include "backends/https/post_request.h"
#include "http/http_client.h"
#include "platform/limited_line.h"

namespace veltrad::backends {

// One for all HTTPS back ends, which it outlives, their posts included.
class EventPosts {
 public:
  EventPosts(http::HTTPClient& http, const platform::Clock& clock, platform::Counters& counters)
      : _http(http), _clock(clock), _counters(counters) {}

  // What is posted, and who is told of its end.
  struct Post {
    std::string json;
    std::optional<EventMap> eventMap;
    std::size_t eventCount = 0;
    // Pays for the post and, with `completionBytes`, for what its completion keeps.
    platform::Charge charge;
    std::size_t completionBytes = 0;
    VeltraBackend::FlushCompletion completion;  // may be empty
  };

  // Takes out what JSON cannot carry, and counts it.
  void restrict(Dictionary& event) const;
  JSONMessage createMessageForPostAndLogging(std::vector<Dictionary> events, const std::string& clientID,
                                             bool wantPretty) const;
  // An answer 5xx disables the back end, which the post keeps alive.
  void postJSONMessage(const std::shared_ptr<VeltraBackend>& backEnd, const SessionFacts& facts,
                       const std::optional<std::string>& url, Post post);
  // Nothing is kept for what is not posted: such events are lost, counted, and `completion` is told.
  void refusePost(VeltraBackend& backEnd, std::size_t eventCount,
                  const VeltraBackend::FlushCompletion& completion);
  // The lines that were held back: before the daemon ends.
  void sayRest();

 private:
  // Nothing: the post ended without an error.
  std::optional<wire::ReportingError> handleAnswer(VeltraBackend& backEnd, const http::HTTPResult& result,
                                                   const std::string& url, std::size_t eventCount);

  // Constant after construction.
  http::HTTPClient& _http;
  const platform::Clock& _clock;
  platform::Counters& _counters;

  // One for all, so that many sessions make no more lines than one.
  platform::LimitedLine _errorLine{"posts"};
};

}  // namespace veltrad::backends
