// SPDX-License-Identifier: Apache-2.0
// Compresses and posts a lent file, and handles the server's answer.
#include "backends/upload/upload_backend.h"

#include <cerrno>
#include <cstring>

#include "backends/upload/compressed_file.h"
#include "backends/upload/file_uploads.h"
#include "backends/upload/upload_request.h"
#include "base/text.h"
#include "platform/counters.h"
#include "platform/log.h"
#include "platform/memory_budget.h"
#include "support/gzip.h"

namespace veltrad::backends {

namespace {

// The server's answer contains this if it has stored the file.
constexpr std::string_view kConfirmation = "success";

FileUploads::User userOf(const std::shared_ptr<platform::MemoryAccount>& account) {
  return account ? FileUploads::User(account->uid()) : std::nullopt;
}

// The reason for an exchange that ended without an answer.
wire::Reason fateAfter(http::HTTPError::Kind kind) {
  switch (kind) {
    case http::HTTPError::Kind::transport:
      return wire::Reason::file_exchange_failed;
    case http::HTTPError::Kind::tooLarge:
      return wire::Reason::file_answer_too_large;
    case http::HTTPError::Kind::tooMany:
    case http::HTTPError::Kind::shortage:
      return wire::Reason::file_shortage;
    case http::HTTPError::Kind::stopping:
      return wire::Reason::file_stopped;
    case http::HTTPError::Kind::refused:
      return wire::Reason::file_refused_by_owner;
  }
  return wire::Reason::file_exchange_failed;
}

void sayUnreadable(const std::string& path, int error) {
  logError("UploadBackend(uploadFileAtPath): File %s cannot be read: %s", path.c_str(), std::strerror(error));
}

}  // namespace

std::shared_ptr<UploadBackend> UploadBackend::initWithName(const UploadMaking& making,
                                                           const std::string& name,
                                                           const config::UploadProfile* profile,
                                                           const std::string& productFamily) {
  if (!profile || !profile->postURL) {
    logError("UploadBackend(initWithName): can't resolve upload post URL.");
    making.counters.count(wire::Reason::no_post_url);
    return nullptr;
  }
  std::shared_ptr<UploadBackend> backend(new UploadBackend(making, name, *profile->postURL, productFamily));
  backend->setDisplayURL(profile->displayURL);
  return backend;
}

UploadBackend::UploadBackend(const UploadMaking& making, const std::string& name,
                             const std::string& uploadURL, const std::string& productFamily)
    : VeltraBackend(name, productFamily, making.random),
      _uploads(making.uploads),
      _http(making.http),
      _lentFiles(making.lentFiles),
      _counters(making.counters),
      _scratchDirectory(making.scratchDirectory),
      _uploadURL(uploadURL) {}

bool UploadBackend::uploadFileAtPath(const std::string& path, const std::string& extensionToken,
                                     const MessageNote& note) {
  _fate = stepOf(note);
  logDebug("UploadBackend(uploadFileAtPath): Uploading file %s", path.c_str());
  if (prohibition()) {
    logError("UploadBackend(uploadFileAtPath): File %s stays: the owner of the device does not let it leave",
             path.c_str());
    drop(wire::Reason::file_refused_by_owner);
    return false;
  }
  const auto lent = _lentFiles.consume(extensionToken);
  auto file = fileToUpload(lent.get(), path);
  if (!file) return false;
  const auto facts = this->facts();
  auto place = _uploads.enter(userOf(facts->account), _http, facts->client);
  if (!place) {
    sayStopping();
    return false;
  }
  CompressedFile gzipped(_scratchDirectory);
  if (!compress(*file, path, gzipped)) return false;
  auto request = uploadRequest(_uploadURL, facts->device.udid, facts->sessionID, path);
  if (!request) {
    logError("UploadBackend(uploadFileAtPath): Unable to create URL request");
    drop(wire::Reason::file_bad_address);
    return false;
  }
  gzipped.become(*request);
  notePost(*request);
  request->client = facts->client;
  request->about = aboutDeparture(name(), *facts, std::nullopt, {});
  place->requests();
  if (confirms(_http.perform(std::move(*request)))) remove(*lent, *file, path);
  return true;
}

// Nothing if the file cannot be uploaded, which is logged and counted.
std::optional<FileSnapshot> UploadBackend::fileToUpload(const platform::LentFile* lent,
                                                        const std::string& path) const {
  if (comesFromOthers(lent, path)) return std::nullopt;
  const auto file = FileSnapshot::of(lent ? lent->descriptor() : -1);
  if (!file) {
    logError("UploadBackend(uploadFileAtPath): Only upload a regular file.");
    drop(wire::Reason::file_not_regular);
    return std::nullopt;
  }
  if (file->size() > FileSnapshot::kMostBytes) {
    logError("UploadBackend(uploadFileAtPath): File %s has %lld bytes: at most %lld are uploaded",
             path.c_str(), static_cast<long long>(file->size()),
             static_cast<long long>(FileSnapshot::kMostBytes));
    drop(wire::Reason::file_too_large);
    return std::nullopt;
  }
  const auto content = file->content();
  if (content == FileSnapshot::Content::some) return file;
  if (content == FileSnapshot::Content::unreadable) sayUnreadable(path, errno);
  logError("UploadBackend(uploadFileAtPath): Input file is empty");
  drop(wire::Reason::file_empty);
  return std::nullopt;
}

// On such a file system even fstat may block forever.
bool UploadBackend::comesFromOthers(const platform::LentFile* lent, const std::string& path) const {
  if (!lent) return false;
  const auto origin = lent->origin();
  if (origin.kind != wire::FileOrigin::Kind::foreign) return false;
  logError(
      "UploadBackend(uploadFileAtPath): File %s lies on a file system of type %s, whose reads may never "
      "end: only a copy of it can be uploaded",
      path.c_str(), origin.fileSystem.c_str());
  drop(wire::Reason::file_foreign);
  return true;
}

// Logs and counts a failure.
bool UploadBackend::compress(FileSnapshot& file, const std::string& path, CompressedFile& into) const {
  std::optional<wire::Reason> fate = wire::Reason::file_not_compressed;
  const auto next = [&](char* bytes, std::size_t room) -> std::optional<std::size_t> {
    if (_http.stopping()) {
      fate.reset();
      sayStopping();
      return std::nullopt;
    }
    const auto count = file.read(bytes, room);
    if (!count) {
      sayUnreadable(path, errno);
      fate = wire::Reason::file_unreadable;
    }
    return count;
  };
  const auto keep = [&](std::string_view bytes) {
    if (into.append(bytes)) return true;
    logError("UploadBackend(uploadFileAtPath): No room for the compressed bytes of %s in %s: %s",
             path.c_str(), _scratchDirectory.c_str(), std::strerror(errno));
    fate = wire::Reason::file_no_room;
    return false;
  };
  if (support::gzipDeflate(next, keep)) return true;
  if (fate) drop(*fate);
  return false;
}

void UploadBackend::sayStopping() const {
  logError("UploadBackend(uploadFileAtPath): The daemon is stopping");
  drop(wire::Reason::file_stopped);
}

void UploadBackend::drop(wire::Reason why) const {
  _counters.count(why);
  pen().write(wire::Step::dropped, why, _fate);
}

void UploadBackend::notePost(const http::HTTPRequest& request) {
  _fate.post = pen().newNumber();
  _fate.text = pen().textOf(request.url);
  _fate.bytes = static_cast<std::uint32_t>(request.fileBody ? request.fileBody->bytes : request.body.size());
  _fate.events = 1;
  pen().write(wire::Step::posted, std::nullopt, _fate);
}

// Also logs and counts how the exchange ended.
bool UploadBackend::confirms(const http::HTTPResult& answer) {
  if (!answer) {
    logError("UploadBackend(uploadFileAtPath): post %s", answer.error().description.c_str());
    const wire::Reason why = fateAfter(answer.error().kind);
    _counters.count(why);
    pen().write(answer.error().mayHaveArrived() ? wire::Step::lost : wire::Step::dropped, why, _fate);
    return false;
  }
  _fate.status = static_cast<std::uint16_t>(answer.value().status);
  if (answer.value().body.empty()) {
    logError("UploadBackend(uploadFileAtPath): post (null)");
    _counters.count(wire::Reason::file_not_confirmed);
    pen().write(wire::Step::answered, wire::Reason::file_not_confirmed, _fate);
    return false;
  }
  const std::string& body = answer.value().body;
  const bool text = isUTF8(body);
  logDebug("UploadBackend(uploadFileAtPath): sending to |%s|, Json output: %s", _uploadURL.c_str(),
           text ? body.c_str() : "(undecodable)");
  const bool confirmed = text && body.find(kConfirmation) != std::string::npos;
  const wire::Reason end = confirmed ? wire::Reason::file_uploaded : wire::Reason::file_not_confirmed;
  _counters.count(end);
  pen().write(wire::Step::answered, end, _fate);
  return confirmed;
}

void UploadBackend::remove(const platform::LentFile& lent, const FileSnapshot& file,
                           const std::string& path) const {
  if (file.changed()) {
    logWarning("UploadBackend(uploadFileAtPath): File %s has changed since its upload began, so it stays",
               path.c_str());
    _counters.count(wire::Reason::file_changed);
    return;
  }
  _counters.count(lent.askForRemoval() ? wire::Reason::file_removal_asked
                                       : wire::Reason::file_removal_not_asked);
}

}  // namespace veltrad::backends
