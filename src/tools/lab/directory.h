// SPDX-License-Identifier: Apache-2.0
// The lab's directory: its certificate, its signing key, and the storebags that a developer edits. Any
// thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"
#include "config/storebag_signing.h"

namespace veltrad::lab {

// `modified` is in seconds since 1970.
struct StorebagFile {
  Dictionary storebag;
  std::int64_t modified;
};

struct StorebagFailure {
  enum class Kind { notFound, unreadable };
  Kind kind;
  std::string description;
};

class Directory {
 public:
  // Makes what is missing: the certificate with its key, signing/, storebags/ (with an example) and
  // received/. The error is one line that names the path.
  static Result<Directory, std::string> open(const std::string& path);

  std::string certificatePath() const { return _path + "/certificate.pem"; }
  std::string certificateKeyPath() const { return _path + "/certificate-key.pem"; }
  std::string publicKeyPath() const { return _path + "/signing/publicKey.der"; }
  std::string receivedPath(std::string_view kind) const {
    return _path + "/received/" + std::string(kind) + ".jsonl";
  }
  const config::SigningKey& signingKey() const { return _signingKey; }

  // Reads NAME.plist, else NAME.json. Replaces "${url}" in texts by `url`, and a text "${dashboardPort}" by
  // the number.
  Result<StorebagFile, StorebagFailure> storebag(const std::string& name, const std::string& url,
                                                 int dashboardPort) const;

 private:
  Directory(std::string path, config::SigningKey signingKey)
      : _path(std::move(path)), _signingKey(std::move(signingKey)) {}

  const std::string _path;
  const config::SigningKey _signingKey;
};

}  // namespace veltrad::lab
