// UploadBackend: one file of the client, gzipped, to the upload server. The session's thread runs all of it
// and waits for the server.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/backend.h"
#include "backends/backend_factory.h"
#include "backends/upload/file_snapshot.h"
#include "http/http_client.h"

namespace veltrad::platform {
class LentFile;
class LentFiles;
}  // namespace veltrad::platform

namespace veltrad::backends {

class CompressedFile;
class FileUploads;

// Keeps nothing between uploads but its address. Sees a file through the descriptor that its client lent,
// never by a path. Takes no part in message reporting.
class UploadBackend final : public VeltraBackend {
 public:
  // From a storebag's section: "post_url" (without a query), and where given "display_url". Null, after one
  // error line, without the first.
  static std::shared_ptr<UploadBackend> initWithName(const BackendServices& services, FileUploads& uploads,
                                                     const std::string& name,
                                                     const config::UploadProfile* profile,
                                                     const std::string& productFamily);

  // True when the request was carried out, whatever became of it: the answer alone decides whether the client
  // is asked to remove its file. Error lines say why it was not.
  bool uploadFileAtPath(const std::string& path, const std::string& extensionToken) override;

  // Any thread.
  std::optional<std::string> uploadURL() const;
  void setUploadURL(std::optional<std::string> value);

 private:
  UploadBackend(const BackendServices& services, FileUploads& uploads, const std::string& name,
                const std::string& productFamily);

  std::optional<FileSnapshot> fileToUpload(const platform::LentFile* lent, const std::string& path) const;
  bool comesFromOthers(const platform::LentFile* lent, const std::string& path) const;
  bool compress(FileSnapshot& file, const std::string& path, CompressedFile& into) const;
  bool confirms(const std::string& url, const http::HTTPResult& answer) const;
  void sayStopping() const;
  void remove(const platform::LentFile& lent, const FileSnapshot& file, const std::string& path) const;

  // Constant after construction.
  FileUploads& _uploads;
  http::HTTPClient& _http;
  platform::Counters& _counters;
  platform::LentFiles& _lentFiles;
  const std::string _scratchDirectory;

  mutable Mutex _urlMutex BACKEND_LOCK;
  std::optional<std::string> _uploadURL GUARDED_BY(_urlMutex);
};

}  // namespace veltrad::backends
