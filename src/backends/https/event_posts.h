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

class PostSpool;
struct SpooledPost;

// One object serves all HTTPS post back ends. It must outlive them and their posts, and what its constructor
// takes must outlive it. Without a spool posts that fail are lost.
class EventPosts {
 public:
  EventPosts(http::HTTPClient& http, const platform::Clock& clock, platform::Counters& counters,
             config::OperatorSettings& choices, PostSpool* spool = nullptr)
      : _http(http), _clock(clock), _counters(counters), _choices(choices), _spool(spool) {}

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
    // The entry for the record of fates: its message or batch.
    wire::StepEntry fate = {};
  };

  // Removes and counts fields that JSON cannot represent.
  void restrict(Dictionary& event) const;
  JSONMessage createMessageForPostAndLogging(std::vector<std::string> events, const std::string& clientID,
                                             bool wantPretty) const;
  // The post keeps the back end alive. A status of 5xx disables the back end, unless the post is kept.
  // Returns what has become of the post if it has not begun.
  std::optional<wire::Decision> postJSONMessage(const std::shared_ptr<VeltraBackend>& backEnd,
                                                const SessionFacts& facts,
                                                const std::optional<std::string>& url, Post post);
  // True if failed posts are kept, so that `about` is needed.
  bool keepsPosts() const { return _spool != nullptr; }
  // Counts the events as lost, under the reason that it returns, and calls `completion`, if there is one.
  wire::Reason refusePost(VeltraBackend& backEnd, std::size_t eventCount,
                          const VeltraBackend::FlushCompletion& completion, const wire::StepEntry& fate);
  // Logs the lines that were held back. Called before the daemon ends.
  void sayRest();
  // Frees the memory that is kept between posts.
  void rest() { _gzip.rest(); }

 private:
  static std::uint64_t notePost(const VeltraBackend& backEnd, const http::HTTPRequest& request,
                                wire::StepEntry fate);
  std::optional<wire::Decision> postOrKeep(const std::shared_ptr<VeltraBackend>& backEnd,
                                           const SessionFacts& facts, http::HTTPRequest request,
                                           const wire::StepEntry& fate,
                                           VeltraBackend::FlushCompletion completion, bool charged);
  // The end of a post that may be kept.
  void endedOrKept(VeltraBackend& backEnd, const std::shared_ptr<SpooledPost>& post,
                   const VeltraBackend::FlushCompletion& completion, const http::HTTPResult& result);
  int compressionLevel();
  // Writes and counts what has become of the events. `fate` names them in the record.
  std::optional<wire::ReportingError> handleAnswer(VeltraBackend& backEnd, const http::HTTPResult& result,
                                                   const std::string& url, std::size_t eventCount,
                                                   wire::StepEntry fate);

  http::HTTPClient& _http;
  const platform::Clock& _clock;
  platform::Counters& _counters;
  config::OperatorSettings& _choices;
  PostSpool* const _spool;

  // Shared, so that many sessions log no more lines than one.
  platform::LimitedLine _errorLine{"posts"};
  support::GzipCompressor _gzip;
};

}  // namespace veltrad::backends
