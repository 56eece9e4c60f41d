// The lab's directory: its certificate, its signing key, the storebags that a developer edits. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"
#include "config/storebag_signing.h"

namespace veltrad::lab {

// A storebag as its file says it now.
struct StorebagFile {
  Dictionary storebag;
  std::int64_t modified;  // seconds since 1970
};

struct StorebagFailure {
  enum class Kind { notFound, unreadable };
  Kind kind;
  std::string description;  // one line, names the file and what was expected
};

class Directory {
 public:
  // Makes what is missing: the certificate with its key, signing/, storebags/ (with an example), received/.
  // The error is one line that names the path.
  static Result<Directory, std::string> open(const std::string& path);

  std::string certificatePath() const { return _path + "/certificate.pem"; }
  std::string certificateKeyPath() const { return _path + "/certificate-key.pem"; }
  std::string publicKeyPath() const { return _path + "/signing/publicKey.der"; }
  std::string receivedPath(std::string_view kind) const {
    return _path + "/received/" + std::string(kind) + ".jsonl";
  }
  const config::SigningKey& signingKey() const { return _signingKey; }

  // NAME.plist, else NAME.json, read afresh; every "${url}" in its texts becomes `url`, and a text that is
  // "${dashboardPort}" the number.
  Result<StorebagFile, StorebagFailure> storebag(const std::string& name, const std::string& url,
                                                 int dashboardPort) const;

 private:
  Directory(std::string path, config::SigningKey signingKey)
      : _path(std::move(path)), _signingKey(std::move(signingKey)) {}

  const std::string _path;
  const config::SigningKey _signingKey;
};

}  // namespace veltrad::lab
