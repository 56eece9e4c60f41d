// SPDX-License-Identifier: Apache-2.0
// UploadBackend: compresses files of the client and posts them to the upload server. The session's thread
// does all of it and waits for the server.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/backend.h"
#include "backends/upload/file_snapshot.h"
#include "config/storebag_content.h"
#include "http/http_client.h"
#include "platform/lent_files.h"

namespace veltrad::backends {

class CompressedFile;
class FileUploads;

// What an upload back end uses. The references must outlive it.
struct UploadMaking {
  platform::Random& random;
  FileUploads& uploads;
  http::HTTPClient& http;
  platform::LentFiles& lentFiles;
  platform::Counters& counters;
  std::string scratchDirectory;
};

// Reads a file through the descriptor that its client lent, never by its path. Takes no part in message
// reporting.
class UploadBackend final : public VeltraBackend {
 public:
  // From a storebag's section: "post_url" (without a query) and optionally "display_url". Null, after one
  // error line, without "post_url".
  static std::shared_ptr<UploadBackend> initWithName(const UploadMaking& making, const std::string& name,
                                                     const config::UploadProfile* profile,
                                                     const std::string& productFamily);

  // True if the request was made, whatever the result: only the answer decides whether the client is asked to
  // remove its file. Otherwise an error line says why not.
  bool uploadFileAtPath(const std::string& path, const std::string& extensionToken,
                        const MessageNote& note) override;
  std::vector<std::string> hosts() const override { return {http::hostName(_uploadURL)}; }

 private:
  UploadBackend(const UploadMaking& making, const std::string& name, const std::string& uploadURL,
                const std::string& productFamily);

  std::optional<FileSnapshot> fileToUpload(const platform::LentFile* lent, const std::string& path) const;
  bool comesFromOthers(const platform::LentFile* lent, const std::string& path) const;
  bool compress(FileSnapshot& file, const std::string& path, CompressedFile& into) const;
  bool confirms(const http::HTTPResult& answer);
  void sayStopping() const;
  // Counts why the file does not leave.
  void drop(wire::Reason why) const;
  void notePost(const http::HTTPRequest& request);
  void remove(const platform::LentFile& lent, const FileSnapshot& file, const std::string& path) const;

  FileUploads& _uploads;
  http::HTTPClient& _http;
  platform::LentFiles& _lentFiles;
  platform::Counters& _counters;
  const std::string _scratchDirectory;
  const std::string _uploadURL;

  // The session's thread only: what the record of fates says of the upload under way.
  wire::StepEntry _fate;
};

}  // namespace veltrad::backends
