// SPDX-License-Identifier: Apache-2.0
// Posts events and handles the answers.
#include "backends/https/event_posts.h"

#include <fmt/format.h>
#include <fmt/printf.h>

#include <cstdint>
#include <utility>

#include "backends/https/json_fields.h"
#include "backends/https/post_spool.h"
#include "backends/https/spool_verdicts.h"
#include "config/operator_settings.h"
#include "platform/counters.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::backends {

namespace {
wire::Reason reasonOf(const http::HTTPError& error) {
  switch (error.kind) {
    case http::HTTPError::Kind::transport:
    case http::HTTPError::Kind::tooLarge:
      return wire::Reason::post_failed;
    case http::HTTPError::Kind::tooMany:
      return wire::Reason::too_many_posts;
    case http::HTTPError::Kind::shortage:
      return wire::Reason::post_shortage;
    case http::HTTPError::Kind::stopping:
      return wire::Reason::post_stopped;
    case http::HTTPError::Kind::refused:
      return error.refusal == wire::Reason::over_daily_limit ? wire::Reason::over_daily_limit
                                                             : wire::Reason::refused_by_owner;
  }
  return wire::Reason::post_failed;
}

// Whether the owner withholds a name by which the client entry is chosen.
bool hidesNames(const SessionFacts& facts) {
  const auto name = [](const SharedDictionary& info, const char* key) {
    return info ? info->string(key) : nullptr;
  };
  for (const char* key : {wire::kVeltraUserInfoClientName, wire::kVeltraUserInfoServiceName}) {
    const std::string* given = name(facts.userInfo, key);
    const std::string* sent = name(facts.sentUserInfo, key);
    if (given && (!sent || *given != *sent)) return true;
  }
  return false;
}

// Copies the data that is needed to send the post again. The request shares its body.
void takeForSpool(const std::shared_ptr<SpooledPost>& post, const SessionFacts& facts,
                  http::HTTPRequest& request) {
  support::SpoolEntry& entry = post->entry;
  entry.url = request.url;
  entry.headers = request.headers;
  entry.body = std::move(request.body);
  entry.events = static_cast<std::uint32_t>(request.events);
  entry.uid = facts.account ? facts.account->uid() : 0;
  entry.connection = facts.connection;
  entry.asksEntry = facts.requireUserInfo;
  if (request.client) entry.client = *request.client;
  entry.about = request.about;
  entry.namesHidden = hidesNames(facts);
  post->charge = std::move(request.charge);
  request.sharedBody = std::shared_ptr<const std::string>(post, &entry.body);
  request.isKept = true;
}

wire::StepEntry entryOf(std::uint64_t post) {
  wire::StepEntry entry;
  entry.post = post;
  return entry;
}

void logPostError(const std::optional<std::string>& text) {
  if (text) logError("HTTPSPostBackend(postJsonMessage): post error: %s", text->c_str());
}
}  // namespace

void EventPosts::sayRest() {
  logPostError(_errorLine.rest());
}

void EventPosts::restrict(Dictionary& event) const {
  _counters.count(wire::Reason::field_not_json, restrictEventForJSON(event));
}

JSONMessage EventPosts::createMessageForPostAndLogging(std::vector<std::string> events,
                                                       const std::string& clientID, bool wantPretty) const {
  const double postTime = platform::timevalToSeconds(_clock.now());
  JSONMessage message{PostText(postTime, clientID, std::move(events)), std::nullopt};
  if (wantPretty) message.pretty = message.text.readable();
  return message;
}

std::optional<wire::Decision> EventPosts::postJSONMessage(const std::shared_ptr<VeltraBackend>& backEnd,
                                                          const SessionFacts& facts,
                                                          const std::optional<std::string>& url, Post post) {
  if (!url) {
    _counters.count(wire::Reason::post_url_nil, post.eventCount);
    backEnd->pen().write(wire::Step::dropped, wire::Reason::post_url_nil, post.fate);
    if (post.completion) post.completion(std::nullopt, wire::makeReportingError("postURL is nil", -1));
    return wire::Decision{wire::Fate::dropped, wire::Reason::post_url_nil};
  }
  http::HTTPRequest request =
      makePostRequest(facts, *url, post.text, post.eventMap, {_gzip, compressionLevel()});
  request.events = post.eventCount;
  request.client = facts.client;
  request.about = std::move(post.about);
  request.sequence = reinterpret_cast<std::uintptr_t>(backEnd.get());
  request.charge = std::move(post.charge);
  const bool charged =
      !facts.account || request.charge.resize(http::keptBytes(request) + post.completionBytes);
  if (_spool)
    return postOrKeep(backEnd, facts, std::move(request), post.fate, std::move(post.completion), charged);
  if (!charged) {
    return wire::Decision{wire::Fate::dropped,
                          refusePost(*backEnd, post.eventCount, post.completion, post.fate)};
  }
  backEnd->postBegins();
  const std::uint64_t number = notePost(*backEnd, request, post.fate);
  const auto answered = [this, backEnd, number, postedTo = *url, eventCount = post.eventCount,
                         completion = std::move(post.completion)](const http::HTTPResult& result) {
    backEnd->postEnded(result ? fmt::format("HTTP {}", result.value().status) : result.error().description);
    auto error = handleAnswer(*backEnd, result, postedTo, eventCount, entryOf(number));
    if (completion) completion(std::nullopt, std::move(error));
  };
  if (const auto started = _http.start(std::move(request), answered); !started) {
    answered(Failure{started.error()});
    return wire::Decision{wire::Fate::dropped, reasonOf(started.error())};
  }
  return std::nullopt;
}

std::optional<wire::Decision> EventPosts::postOrKeep(const std::shared_ptr<VeltraBackend>& backEnd,
                                                     const SessionFacts& facts, http::HTTPRequest request,
                                                     const wire::StepEntry& fate,
                                                     VeltraBackend::FlushCompletion completion,
                                                     bool charged) {
  constexpr wire::Decision kKept{wire::Fate::kept, wire::Reason::kept_in_spool};
  const auto post = std::make_shared<SpooledPost>();
  post->entry.id = support::newPostID();
  request.headers.emplace_back("X-VLT-Post-ID", support::textOf(post->entry.id));
  post->fate = notePost(*backEnd, request, fate);
  takeForSpool(post, facts, request);
  backEnd->postBegins();
  if (const auto refusal = _spool->admit(*post)) {
    const std::string why = "Kept for later: " + *refusal;
    post->entry.lastError = *refusal;
    backEnd->postEnded(why);
    _spool->keep(post);
    if (completion) completion(std::nullopt, wire::makeReportingError(why, -1));
    return kKept;
  }
  const auto answered = [this, backEnd, post,
                         completion = std::move(completion)](const http::HTTPResult& result) {
    endedOrKept(*backEnd, post, completion, result);
  };
  const http::HTTPError tooMany{http::HTTPError::Kind::tooMany, "Too many posts under way"};
  const auto started =
      charged ? _http.start(std::move(request), answered) : Result<Done, http::HTTPError>(Failure{tooMany});
  if (started) return std::nullopt;
  answered(Failure{started.error()});
  const bool kept = isToBeKept(Failure{started.error()});
  return kept ? kKept : wire::Decision{wire::Fate::dropped, reasonOf(started.error())};
}

void EventPosts::endedOrKept(VeltraBackend& backEnd, const std::shared_ptr<SpooledPost>& post,
                             const VeltraBackend::FlushCompletion& completion,
                             const http::HTTPResult& result) {
  backEnd.postEnded(outcomeOf(result));
  std::optional<wire::ReportingError> error;
  if (!isToBeKept(result)) {
    error = handleAnswer(backEnd, result, post->entry.url, post->entry.events, entryOf(post->fate));
  } else if (result) {
    const int status = result.value().status;
    error =
        wire::makeReportingError(fmt::format("The server answered {}, and the post is kept", status), status);
    logDebug("HTTPSPostBackend(postJsonMessage): posted to %s: %s", post->entry.url.c_str(),
             error->description.c_str());
  } else {
    error = wire::makeReportingError(result.error().description, -1);
    logPostError(_errorLine.happened(error->description));
  }
  _spool->ended(post, result);
  if (completion) completion(std::nullopt, std::move(error));
}

// Returns the post's number in the record.
std::uint64_t EventPosts::notePost(const VeltraBackend& backEnd, const http::HTTPRequest& request,
                                   wire::StepEntry fate) {
  const platform::FateWriter& pen = backEnd.pen();
  if (!pen.writes()) return 0;
  fate.post = pen.newNumber();
  fate.text = pen.textOf(request.url);
  fate.bytes = static_cast<std::uint32_t>(request.body.size());
  fate.events = static_cast<std::uint32_t>(request.events);
  fate.time = 0;
  pen.write(wire::Step::posted, std::nullopt, fate);
  return fate.post;
}

int EventPosts::compressionLevel() {
  const auto choices = _choices.current();
  return (choices ? *choices : config::OperatorChoices()).compression.level;
}

wire::Reason EventPosts::refusePost(VeltraBackend& backEnd, std::size_t eventCount,
                                    const VeltraBackend::FlushCompletion& completion,
                                    const wire::StepEntry& fate) {
  const http::HTTPError refusal{http::HTTPError::Kind::tooMany, "Too many posts under way"};
  auto error = handleAnswer(backEnd, Failure{refusal}, {}, eventCount, fate);
  if (completion) completion(std::nullopt, std::move(error));
  return wire::Reason::too_many_posts;
}

std::optional<wire::ReportingError> EventPosts::handleAnswer(VeltraBackend& backEnd,
                                                             const http::HTTPResult& result,
                                                             const std::string& url, std::size_t eventCount,
                                                             wire::StepEntry fate) {
  std::optional<wire::ReportingError> error;
  if (!result.ok()) {
    const std::string& description = result.error().description;
    logPostError(_errorLine.happened(description));
    logDebug("HTTPSPostBackend(postJsonMessage): posted to %s", url.c_str());
    error = wire::makeReportingError(description, -1);
  }
  const int status = result.ok() ? result.value().status : result.error().status;
  const PostVerdict verdict = verdictOfStatus(status);
  const bool answered = result.ok() || verdict.disablesBackend;
  const wire::Reason reason = answered ? verdict.reason : reasonOf(result.error());
  if (answered) fate.status = static_cast<std::uint16_t>(status);
  backEnd.pen().write(answered                          ? wire::Step::answered
                      : result.error().mayHaveArrived() ? wire::Step::lost
                                                        : wire::Step::dropped,
                      reason, fate);
  _counters.count(reason, eventCount);
  if (!verdict.disablesBackend) return error;
  const std::string text =
      fmt::sprintf("backend %s disabled by server %d return code", backEnd.name(), status);
  logInfo("postJSONMessage: %s", text.c_str());
  backEnd.setState({kBackendDisabled, wire::Reason::server_error});
  return wire::makeReportingError(text, status);
}

}  // namespace veltrad::backends
