// The array's archive, its post, the location that comes back.
#include "backends/dashboard/log_data_uploads.h"

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

std::optional<std::string> LogDataUploads::upload(const std::optional<std::string>& postURL,
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
  const auto body = post(*postURL, std::move(*archive));
  if (!body.ok() || body.value().empty()) {
    logError("DashboardBackend(uploadLogData): Error uploading log data array (%s)",
             body.ok() ? "" : body.error().c_str());
    return std::nullopt;
  }
  std::string location = toUTF8(body.value());
  logDebug("DashboardBackend(uploadLogData): Log data uploaded to %s", location.c_str());
  return location;
}

Result<std::string, std::string> LogDataUploads::post(const std::string& url, std::string archive) {
  const std::size_t bytes = archive.size();
  if (!reserve(bytes)) return Failure<std::string>{"Too many log data uploads under way"};
  platform::HTTPRequest request;
  request.method = platform::HTTPRequest::Method::post;
  request.lane = platform::HTTPRequest::Lane::upload;
  request.url = url;
  request.headers = {{"Content-Type", "application/octet-stream"}};
  request.body = std::move(archive);
  platform::HTTPResult result = _http.perform(std::move(request));
  release(bytes);
  if (!result.ok()) return Failure{result.error().description};
  return std::move(result.value().body);
}

bool LogDataUploads::reserve(std::size_t bytes) {
  const Lock held(_mutex);
  if (_bytesUnderWay > 0 && _bytesUnderWay + bytes > kMostBytes) return false;
  _bytesUnderWay += bytes;
  return true;
}

void LogDataUploads::release(std::size_t bytes) {
  const Lock held(_mutex);
  _bytesUnderWay -= bytes;
}

}  // namespace veltrad
