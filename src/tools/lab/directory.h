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
  // Of a file that is signed already and served as it is; otherwise empty.
  std::string container = {};
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
  std::string ed25519KeyPath() const { return _path + "/signing/ed25519.der"; }
  // The keys of this name (see stamp.h), read now. The error is one line that names the path.
  Result<config::SigningKey, std::string> signingKey(const std::string& name) const;
  Result<config::SigningKey, std::string> ed25519Key(const std::string& name) const;

  // Reads NAME, which is signed already, else NAME.plist, else NAME.json. Replaces "${url}" in texts of the
  // latter by `url`, and a text "${dashboardPort}" by the number.
  Result<StorebagFile, StorebagFailure> storebag(const std::string& name, const std::string& url,
                                                 int dashboardPort) const;

 private:
  explicit Directory(std::string path) : _path(std::move(path)) {}
  std::string keysOf(const std::string& name) const;
  Result<StorebagFile, StorebagFailure> signedStorebag(const std::string& path) const;

  const std::string _path;
};

}  // namespace veltrad::lab
