// SPDX-License-Identifier: Apache-2.0
// Reads replies, and implements the C interface's functions on them.
#include "client/answer.h"

#include "base/property_list.h"
#include "base/version.h"
#include "wire/constants.h"
#include "wire/limits.h"
#include "wire/names.h"

namespace veltrad::client {

namespace key = wire::key;

namespace {

Answer unreadable() {
  return answerOfStatus(VELTRA_NO_REPLY, "The daemon's reply could not be read.");
}

}  // namespace

Answer answerOfStatus(veltra_status status, const char* description) {
  auto answer = std::make_unique<veltra_reply>();
  answer->status = status;
  if (status != VELTRA_OK) {
    answer->error = wire::ReportingError{wire::kVeltraErrorDomain, -1,
                                         description ? description : veltra_status_text(status)};
  }
  return answer;
}

Answer answerOfReply(std::string_view body) {
  const auto parsed = parseBinaryPropertyList(body, wire::kDaemonFrameLimits);
  const Dictionary* reply = parsed ? parsed.value().asDictionary() : nullptr;
  if (!reply) return unreadable();
  auto answer = std::make_unique<veltra_reply>();
  if (const Dictionary* error = reply->dictionary(key::kError)) {
    answer->error = wire::errorOfDictionary(*error);
    answer->status =
        answer->error->description == wire::kNoReplyDescription ? VELTRA_NO_REPLY : VELTRA_REFUSED;
    return answer;
  }
  const Dictionary* results = reply->dictionary(key::kResults);
  if (!results) return unreadable();
  if (const std::string* text = results->string(key::kReply)) answer->text = *text;
  if (const Value* backends = results->find(key::kBackends); backends && backends->asArray()) {
    answer->backends = nodeOfValue(*backends);
  }
  if (const Value* outcomes = results->find(key::kOutcomes); outcomes && outcomes->asArray()) {
    answer->outcomes = *outcomes;
  }
  answer->uploaded = results->boolean(key::kUploaded).value_or(false);
  if (const Dictionary* error = results->dictionary(key::kError))
    answer->error = wire::errorOfDictionary(*error);
  return answer;
}

void settleUpload(veltra_reply& answer) {
  const auto file = std::exchange(answer.file, nullptr);
  if (!file) return;
  std::optional<std::string> problem;
  if (file->removalAsked()) {
    problem = file->remove();
    answer.removed = !problem;
  } else if (answer.status == VELTRA_OK && !answer.uploaded) {
    problem = file->problem();
  }
  if (problem && !answer.error)
    answer.error = wire::ReportingError{wire::kVeltraErrorDomain, -1, std::move(*problem)};
}

}  // namespace veltrad::client

veltra_status veltra_reply_status(const veltra_reply* reply) {
  return reply ? reply->status : VELTRA_INVALID;
}

const char* veltra_reply_text(const veltra_reply* reply, size_t* length) {
  const bool there = reply && reply->text;
  if (length) *length = there ? reply->text->size() : 0;
  return there ? reply->text->c_str() : nullptr;
}

const veltra_value* veltra_reply_backends(const veltra_reply* reply) {
  return reply ? reply->backends.get() : nullptr;
}

const veltra_value* veltra_reply_outcomes(const veltra_reply* reply) {
  if (!reply || !reply->outcomes) return nullptr;
  std::call_once(reply->outcomesAsked,
                 [reply] { reply->outcomesNode = veltrad::client::nodeOfValue(*reply->outcomes); });
  return reply->outcomesNode.get();
}

bool veltra_reply_uploaded(const veltra_reply* reply) {
  return reply && reply->uploaded;
}

bool veltra_reply_removed(const veltra_reply* reply) {
  return reply && reply->removed;
}

const char* veltra_reply_error_domain(const veltra_reply* reply) {
  return reply && reply->error ? reply->error->domain.c_str() : nullptr;
}

int64_t veltra_reply_error_code(const veltra_reply* reply) {
  return reply && reply->error ? reply->error->code : 0;
}

const char* veltra_reply_error_description(const veltra_reply* reply) {
  return reply && reply->error ? reply->error->description.c_str() : nullptr;
}

void veltra_reply_release(veltra_reply* reply) {
  delete reply;
}

const char* veltra_status_text(veltra_status status) {
  static constexpr const char* kTexts[] = {"Done.",
                                           "No daemon listens, or the connection to it has ended.",
                                           "The daemon refused.",
                                           "The session's queue is full; the call was dropped.",
                                           "An argument is not what it must be; nothing was done.",
                                           "The call ended without an answer.",
                                           "A waiting call inside a callback would wait for itself.",
                                           "The call is larger than a frame may be; nothing was sent.",
                                           "The session belongs to the process that forked this one."};
  static_assert(std::size(kTexts) == VELTRA_FORKED + 1);
  const auto place = static_cast<std::size_t>(status);
  return place < std::size(kTexts) ? kTexts[place] : "Unknown status.";
}

const char* veltra_version(void) {
  return veltrad::kVersion;
}
