// SPDX-License-Identifier: Apache-2.0
// Sends results as reply frames.
#include "ipc/pending_reply.h"

#include <fmt/format.h>

#include <new>

#include "ipc/sent_frame.h"
#include "wire/frame.h"
#include "wire/names.h"

namespace veltrad::ipc {

namespace key = wire::key;

PendingReply::~PendingReply() {
  if (_answered.load(std::memory_order_acquire)) return;
  try {
    fail(wire::makeReportingError(wire::kNoReplyDescription, -1));
  } catch (const std::bad_alloc&) {
    _out->requestEnd();
  }
}

void PendingReply::answer(Dictionary results) {
  if (_answered.exchange(true, std::memory_order_acq_rel)) return;
  Dictionary body;
  body.set(key::kResults, std::move(results));
  send(std::move(body));
}

void PendingReply::answerSent(const wire::Outcomes& outcomes) {
  if (_answered.exchange(true, std::memory_order_acq_rel)) return;
  try {
    _out->sendOutcomes(_callID, outcomes);
  } catch (const std::bad_alloc&) {
    _out->requestEnd();
  }
}

void PendingReply::fail(const wire::ReportingError& error) {
  if (_answered.exchange(true, std::memory_order_acq_rel)) return;
  send({{key::kError, wire::dictionaryOfError(error)}});
}

void PendingReply::send(Dictionary body) noexcept {
  try {
    sendFrame(std::move(body));
  } catch (const std::bad_alloc&) {
    _out->requestEnd();  // so that the client does not wait for this reply for ever
  }
}

void PendingReply::sendFrame(Dictionary body) {
  const std::string frame = wire::makeFrame(wire::FrameKind::reply, _callID, std::move(body));
  if (_out->sendReply(frame) != OutQueue::Sent::tooLarge) return;
  const wire::ReportingError error =
      wire::makeReportingError(fmt::format("The reply of {} bytes is larger than a frame may be ({} bytes).",
                                           frame.size() - wire::kFrameHeaderBytes, wire::kFrameBodyLimit),
                               -1);
  _out->sendReply(
      wire::makeFrame(wire::FrameKind::reply, _callID, {{key::kError, wire::dictionaryOfError(error)}}));
}

namespace {

void setError(Dictionary& results, const std::optional<wire::ReportingError>& error) {
  if (error) results.set(key::kError, wire::dictionaryOfError(*error));
}

}  // namespace

wire::StringReply stringReply(std::shared_ptr<PendingReply> pending) {
  if (!pending) return {};
  return [pending = std::move(pending)](std::optional<std::string> text) {
    Dictionary results;
    if (text) results.set(key::kReply, std::move(*text));
    pending->answer(std::move(results));
  };
}

wire::SentReply sentReply(std::shared_ptr<PendingReply> pending) {
  if (!pending) return {};
  return [pending = std::move(pending)](std::optional<std::string> text, const wire::Outcomes& outcomes) {
    if (!text) return pending->answerSent(outcomes);
    Dictionary results = SentFrame::resultsOf(outcomes);
    results.set(key::kReply, std::move(*text));
    pending->answer(std::move(results));
  };
}

wire::NamesReply namesReply(std::shared_ptr<PendingReply> pending) {
  if (!pending) return {};
  return [pending = std::move(pending)](std::optional<std::vector<std::string>> names) {
    Dictionary results;
    if (names) results.set(key::kBackends, Array(names->begin(), names->end()));
    pending->answer(std::move(results));
  };
}

wire::FlushReply flushReply(std::shared_ptr<PendingReply> pending) {
  if (!pending) return {};
  return [pending = std::move(pending)](std::optional<std::string> text,
                                        const std::optional<wire::ReportingError>& error) {
    Dictionary results;
    if (text) results.set(key::kReply, std::move(*text));
    setError(results, error);
    pending->answer(std::move(results));
  };
}

wire::BooleanReply uploadedReply(std::shared_ptr<PendingReply> pending) {
  if (!pending) return {};
  return [pending = std::move(pending)](bool uploaded) { pending->answer({{key::kUploaded, uploaded}}); };
}

wire::UploadLogDataReply uploadLogDataReply(std::shared_ptr<PendingReply> pending) {
  if (!pending) return {};
  return [pending = std::move(pending)](bool uploaded, const std::optional<wire::ReportingError>& error) {
    Dictionary results{{key::kUploaded, uploaded}};
    setError(results, error);
    pending->answer(std::move(results));
  };
}

}  // namespace veltrad::ipc
