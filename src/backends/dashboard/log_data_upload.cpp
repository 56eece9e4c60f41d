// The array's archive, its post, the location that comes back.
#include "backends/dashboard/log_data_upload.h"

#include <new>

#include "base/property_list.h"
#include "base/text.h"
#include "platform/http_client.h"
#include "platform/log.h"

namespace veltrad {

namespace {
// Nothing: memory for it is short.
std::optional<std::string> archiveOf(const Array& logData) {
  try {
    return writeBinaryPropertyList(logData);
  } catch (const std::bad_alloc&) {
    return std::nullopt;
  }
}
}  // namespace

std::optional<std::string> uploadedLogDataLocation(platform::HTTPClient& http,
                                                   const std::optional<std::string>& postURL,
                                                   const Array& logData) {
  if (!postURL) {
    logError("DashboardBackend(uploadLogData): Post URL for log data array is nil");
    return std::nullopt;
  }
  auto archive = archiveOf(logData);
  if (!archive) {
    logError("DashboardBackend(uploadLogData): Failed to serialize log data array for upload");
    return std::nullopt;
  }
  platform::HTTPRequest request;
  request.method = platform::HTTPRequest::Method::post;
  request.lane = platform::HTTPRequest::Lane::upload;
  request.url = *postURL;
  request.headers = {{"Content-Type", "application/octet-stream"}};
  request.body = std::move(*archive);
  const platform::HTTPResult result = http.perform(std::move(request));
  if (!result.ok() || result.value().body.empty()) {
    logError("DashboardBackend(uploadLogData): Error uploading log data array (%s)",
             result.ok() ? "" : result.error().description.c_str());
    return std::nullopt;
  }
  std::string location = toUTF8(result.value().body);
  logDebug("DashboardBackend(uploadLogData): Log data uploaded to %s", location.c_str());
  return location;
}

}  // namespace veltrad
