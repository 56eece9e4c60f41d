// SPDX-License-Identifier: Apache-2.0
// Archives the array, posts it and returns the location.
#include "backends/dashboard/log_data_uploads.h"

#include <new>

#include "base/property_list.h"
#include "base/text.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {
// A location is much shorter.
constexpr std::size_t kMostLogAnswerBytes = 1u << 20;

// Nothing if memory is short.
std::optional<std::string> archiveOf(const Array& logData) {
  try {
    return writeBinaryPropertyList(logData);
  } catch (const std::bad_alloc&) {
    return std::nullopt;
  }
}
}  // namespace

std::optional<std::string> LogDataUploads::upload(const std::optional<std::string>& postURL,
                                                  const Array& logData, const DatagramOwner& owner,
                                                  const platform::FateWriter& pen, wire::StepEntry fate) {
  const auto refused = [&](wire::Reason why) {
    _counters.count(why);
    pen.write(wire::Step::dropped, why, fate);
    return std::nullopt;
  };
  if (!postURL) {
    logError("DashboardBackend(uploadLogData): Post URL for log data array is nil");
    return refused(wire::Reason::log_data_no_address);
  }
  auto archive = archiveOf(logData);
  if (!archive) {
    logError("DashboardBackend(uploadLogData): Failed to serialize log data array for upload");
    return refused(wire::Reason::log_data_no_memory);
  }
  fate.post = pen.newNumber();
  fate.text = pen.textOf(*postURL);
  fate.bytes = static_cast<std::uint32_t>(archive->size());
  fate.events = 1;
  pen.write(wire::Step::posted, std::nullopt, fate);
  const http::HTTPResult answer = post(*postURL, std::move(*archive), owner);
  const bool located = answer && !answer.value().body.empty();
  const wire::Reason end = located  ? wire::Reason::log_data_uploaded
                           : answer ? wire::Reason::log_data_no_place
                                    : wire::Reason::log_data_failed;
  _counters.count(end);
  if (answer) fate.status = static_cast<std::uint16_t>(answer.value().status);
  const wire::Step failure =
      !answer && !answer.error().mayHaveArrived() ? wire::Step::dropped : wire::Step::lost;
  pen.write(answer ? wire::Step::answered : failure, end, fate);
  if (!located) {
    logError("DashboardBackend(uploadLogData): Error uploading log data array (%s)",
             answer ? "" : answer.error().description.c_str());
    return std::nullopt;
  }
  std::string location = toUTF8(answer.value().body);
  logDebug("DashboardBackend(uploadLogData): Log data uploaded to %s", location.c_str());
  return location;
}

http::HTTPResult LogDataUploads::post(const std::string& url, std::string archive,
                                      const DatagramOwner& owner) {
  http::HTTPRequest request;
  request.method = http::HTTPRequest::Method::post;
  request.lane = http::HTTPRequest::Lane::logData;
  request.url = url;
  request.headers = {{"Content-Type", "application/octet-stream"}};
  request.body = std::move(archive);
  request.client = owner.client;
  request.about = owner.about;
  request.mostResponseBytes = kMostLogAnswerBytes;
  return _http.perform(std::move(request));
}

}  // namespace veltrad::backends
