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

// A file that is not there has seen nothing. One that is torn is left as it is and vouches for nothing: to
// take it for an empty one would let through what it was to keep out, so that nothing is accepted until
// somebody removes it.
class SeenStorebagsFile {
 public:
  // The store outlives it.
  SeenStorebagsFile(platform::FileStore& files, std::string path) : _files(files), _path(std::move(path)) {}

  // Why there is nothing to be had: a shortage, or a torn file, in one line that names it.
  struct Failed {
    bool passes;
    std::string description;
  };
  Result<SeenStorebags, Failed> seen();
  // Takes an accepted bag in, on disk before it returns. What cannot be written is one warning, and is
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
