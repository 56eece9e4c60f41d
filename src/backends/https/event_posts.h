// SPDX-License-Identifier: Apache-2.0
// Makes messages of events, posts them and handles the answers. Any thread; answers come on the HTTP thread.
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

namespace veltrad::config {
class OperatorSettings;
}  // namespace veltrad::config

namespace veltrad::backends {

// One object serves all HTTPS post back ends. It outlives them and their posts.
class EventPosts {
 public:
  EventPosts(http::HTTPClient& http, const platform::Clock& clock, platform::Counters& counters,
             config::OperatorSettings& choices)
      : _http(http), _clock(clock), _counters(counters), _choices(choices) {}

  struct Post {
    PostText text;
    std::optional<EventMap> eventMap;
    std::size_t eventCount = 0;
    // Pays for the post and for `completionBytes`, which the completion (it may be empty) keeps.
    platform::Charge charge;
    std::size_t completionBytes = 0;
    VeltraBackend::FlushCompletion completion;
    // As in http::Departure.
    Dictionary about = {};
    // What the record of fates is to say of it: its message or batch.
    wire::StepEntry fate = {};
  };

  // Removes and counts fields that JSON cannot represent.
  void restrict(Dictionary& event) const;
  JSONMessage createMessageForPostAndLogging(std::vector<std::string> events, const std::string& clientID,
                                             bool wantPretty) const;
  // The post keeps the back end alive. A status of 5xx disables the back end. Returns why the post has not
  // begun, if it has not.
  std::optional<wire::Reason> postJSONMessage(const std::shared_ptr<VeltraBackend>& backEnd,
                                              const SessionFacts& facts,
                                              const std::optional<std::string>& url, Post post);
  // Counts the events as lost, under the reason that it returns, and calls `completion`, if there is one.
  wire::Reason refusePost(VeltraBackend& backEnd, std::size_t eventCount,
                          const VeltraBackend::FlushCompletion& completion, const wire::StepEntry& fate);
  // Logs the lines that were held back. Called before the daemon ends.
  void sayRest();
  // Frees what is kept from post to post.
  void rest() { _gzip.rest(); }

 private:
  static std::uint64_t notePost(const VeltraBackend& backEnd, const http::HTTPRequest& request,
                                wire::StepEntry fate);
  static void noteEnd(const VeltraBackend& backEnd, const http::HTTPResult& result, std::uint64_t post);
  int compressionLevel();
  std::optional<wire::ReportingError> handleAnswer(VeltraBackend& backEnd, const http::HTTPResult& result,
                                                   const std::string& url, std::size_t eventCount);

  http::HTTPClient& _http;
  const platform::Clock& _clock;
  platform::Counters& _counters;
  config::OperatorSettings& _choices;

  // Shared, so that many sessions log no more lines than one.
  platform::LimitedLine _errorLine{"posts"};
  support::GzipCompressor _gzip;
};

}  // namespace veltrad::backends
