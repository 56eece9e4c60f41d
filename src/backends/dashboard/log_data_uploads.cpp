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
                                                  const Array& logData, const DatagramOwner& owner) {
  if (!postURL) {
    logError("DashboardBackend(uploadLogData): Post URL for log data array is nil");
    _counters.count(wire::Reason::log_data_no_address);
    return std::nullopt;
  }
  auto archive = archiveOf(logData);
  if (!archive) {
    logError("DashboardBackend(uploadLogData): Failed to serialize log data array for upload");
    _counters.count(wire::Reason::log_data_no_memory);
    return std::nullopt;
  }
  const auto body = post(*postURL, std::move(*archive), owner);
  if (!body.ok() || body.value().empty()) {
    logError("DashboardBackend(uploadLogData): Error uploading log data array (%s)",
             body.ok() ? "" : body.error().c_str());
    _counters.count(body.ok() ? wire::Reason::log_data_no_place : wire::Reason::log_data_failed);
    return std::nullopt;
  }
  _counters.count(wire::Reason::log_data_uploaded);
  std::string location = toUTF8(body.value());
  logDebug("DashboardBackend(uploadLogData): Log data uploaded to %s", location.c_str());
  return location;
}

Result<std::string, std::string> LogDataUploads::post(const std::string& url, std::string archive,
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
  http::HTTPResult result = _http.perform(std::move(request));
  if (!result.ok()) return Failure{result.error().description};
  return std::move(result.value().body);
}

}  // namespace veltrad::backends
