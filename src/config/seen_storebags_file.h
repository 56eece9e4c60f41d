// SPDX-License-Identifier: Apache-2.0
// The file that remembers which serials and revocations of storebags were seen. Any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/result.h"
#include "config/storebag_verdict.h"
#include "platform/file_store.h"

namespace veltrad::config {

// {"serials": {STOREBAG: {FINGERPRINT: NUMBER}}, "revoked": [FINGERPRINT]} in JSON; absent for anything else.
std::optional<SeenStorebags> seenStorebagsIn(std::string_view json);
std::string textOf(const SeenStorebags& seen);

// A missing file counts as empty. A damaged file is not changed, and no storebag is accepted until somebody
// removes it, because an empty record would admit storebags that were refused before.
class SeenStorebagsFile {
 public:
  // The store must outlive it.
  SeenStorebagsFile(platform::FileStore& files, std::string path) : _files(files), _path(std::move(path)) {}

  // Why the record is not available: a shortage, or a damaged file; one line that names the file.
  struct Failed {
    bool passes;
    std::string description;
  };
  Result<SeenStorebags, Failed> seen();
  // Records an accepted bag, on disk before it returns. A failure to write is one warning; the data is
  // written with the next accepted bag.
  void remember(const std::string& name, const StorebagClaims& claims, const StorebagSigners& signers,
                const StorebagRules& rules);
  const std::string& path() const { return _path; }

 private:
  Result<SeenStorebags, Failed> read() REQUIRES(_mutex);

  platform::FileStore& _files;
  const std::string _path;

  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::optional<SeenStorebags> _seen GUARDED_BY(_mutex);  // nothing before the file could be read
  bool _stored GUARDED_BY(_mutex) = true;                 // what was seen is on disk
};

}  // namespace veltrad::config
