// From a lent file to the server's answer. The session's thread.
#include "backends/upload/upload_backend.h"

#include <cerrno>
#include <cstring>

#include "backends/upload/file_snapshot.h"
#include "backends/upload/file_uploads.h"
#include "backends/upload/upload_request.h"
#include "base/text.h"
#include "platform/counters.h"
#include "platform/http_client.h"
#include "platform/lent_files.h"
#include "platform/log.h"
#include "support/gzip.h"

namespace veltrad {

namespace {

// What a server's answer holds where it has stored the file.
constexpr std::string_view kConfirmation = "success";

void sayUnreadable(const std::string& path, int error) {
  logError("UploadBackend(uploadFileAtPath): File %s cannot be read: %s", path.c_str(), std::strerror(error));
}

}  // namespace

std::shared_ptr<UploadBackend> UploadBackend::initWithName(const BackendServices& services,
                                                           FileUploads& uploads, const std::string& name,
                                                           const Dictionary* profile,
                                                           const std::string& productFamily) {
  const std::string* url = profile ? profile->string("post_url") : nullptr;
  if (!url) {
    logError("UploadBackend(initWithName): can't resolve upload post URL.");
    return nullptr;
  }
  std::shared_ptr<UploadBackend> backend(new UploadBackend(services, uploads, name, *profile, productFamily));
  backend->setUploadURL(*url);
  if (const std::string* display = profile->string("display_url")) backend->setDisplayURL(*display);
  return backend;
}

UploadBackend::UploadBackend(const BackendServices& services, FileUploads& uploads, const std::string& name,
                             const Dictionary& profile, const std::string& productFamily)
    : VeltraBackend(name, profile, productFamily, services.random),
      _uploads(uploads),
      _http(services.http),
      _counters(services.counters),
      _lentFiles(services.lentFiles) {}

bool UploadBackend::uploadFileAtPath(const std::string& path, const std::string& extensionToken) {
  logDebug("UploadBackend(uploadFileAtPath): Uploading file %s", path.c_str());
  const auto url = uploadURL();
  if (!url) return false;
  const auto lent = _lentFiles.consume(extensionToken);
  auto file = fileToUpload(lent.get(), path);
  if (!file) return false;
  const FileUploads::Place place(_uploads);
  auto gzipped = compressed(*file, path);
  if (!gzipped) return false;
  auto request = uploadRequest(*url, {udid(), sessionID()}, path, std::move(*gzipped));
  if (!request) {
    logError("UploadBackend(uploadFileAtPath): Unable to create URL request");
    return false;
  }
  _counters.count("file uploaded");
  if (confirms(*url, _http.perform(std::move(*request)))) remove(*lent, *file, path);
  return true;
}

// Nothing: it cannot be uploaded, which has been said and counted.
std::optional<FileSnapshot> UploadBackend::fileToUpload(const platform::LentFile* lent,
                                                        const std::string& path) const {
  const auto file = FileSnapshot::of(lent ? lent->descriptor() : -1);
  if (!file) {
    logError("UploadBackend(uploadFileAtPath): Only upload a regular file.");
    _counters.count("file refused: nothing lent, or no regular file");
    return std::nullopt;
  }
  if (file->size() > FileSnapshot::kMostBytes) {
    logError("UploadBackend(uploadFileAtPath): File %s has %lld bytes: at most %lld are uploaded",
             path.c_str(), static_cast<long long>(file->size()),
             static_cast<long long>(FileSnapshot::kMostBytes));
    _counters.count("file refused: too large");
    return std::nullopt;
  }
  const auto content = file->content();
  if (content == FileSnapshot::Content::some) return file;
  if (content == FileSnapshot::Content::unreadable) sayUnreadable(path, errno);
  logError("UploadBackend(uploadFileAtPath): Input file is empty");
  _counters.count("file refused: empty or unreadable");
  return std::nullopt;
}

std::optional<std::string> UploadBackend::compressed(FileSnapshot& file, const std::string& path) const {
  const auto next = [&](char* bytes, std::size_t room) -> std::optional<std::size_t> {
    if (_http.stopping()) {
      logError("UploadBackend(uploadFileAtPath): The daemon is stopping");
      return std::nullopt;
    }
    const auto count = file.read(bytes, room);
    if (!count) sayUnreadable(path, errno);
    return count;
  };
  return gzipDeflate(next, static_cast<std::size_t>(file.size()));
}

bool UploadBackend::confirms(const std::string& url, const platform::HTTPResult& answer) const {
  if (!answer.ok() || answer.value().body.empty()) {
    logError("UploadBackend(uploadFileAtPath): post %s",
             answer.ok() ? "(null)" : answer.error().description.c_str());
    return false;
  }
  const std::string& body = answer.value().body;
  const bool text = isUTF8(body);
  logDebug("UploadBackend(uploadFileAtPath): sending to |%s|, Json output: %s", url.c_str(),
           text ? body.c_str() : "(undecodable)");
  return text && body.find(kConfirmation) != std::string::npos;
}

void UploadBackend::remove(const platform::LentFile& lent, const FileSnapshot& file,
                           const std::string& path) const {
  if (file.changed()) {
    logWarning("UploadBackend(uploadFileAtPath): File %s has changed since its upload began, so it stays",
               path.c_str());
    _counters.count("file kept: it changed during its upload");
    return;
  }
  lent.askForRemoval();
  _counters.count("file confirmed: its removal was asked for");
}

std::optional<std::string> UploadBackend::uploadURL() const {
  const Lock held(_urlMutex);
  return _uploadURL;
}

void UploadBackend::setUploadURL(std::optional<std::string> value) {
  const Lock held(_urlMutex);
  _uploadURL = std::move(value);
}

}  // namespace veltrad
