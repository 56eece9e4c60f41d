// SPDX-License-Identifier: Apache-2.0
// Keeps downloaded storebags over a restart, one file for each name. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "base/result.h"
#include "platform/file_store.h"

namespace veltrad::platform {
class Clock;
}  // namespace veltrad::platform

namespace veltrad::config {

struct KeptStorebag {
  std::string container;                    // signed, as the server sent it
  std::optional<std::string> lastModified;  // of that answer
  std::int32_t maxAge = 0;                  // seconds
  double fetchTime = 0;                     // seconds since 1970
};

// DIRECTORY/NAME (mode 0600, the directory 0700 and made when needed) is a property list of {"container",
// "lastModified", "maxAge", "fetchTime"}. The file is not trusted: the container's signature is verified
// again. One thread at a time for each name. The constructor's arguments must outlive it.
class StorebagStore {
 public:
  StorebagStore(platform::FileStore& files, const platform::Clock& clock, std::string directory)
      : _files(files), _clock(clock), _directory(std::move(directory)) {}

  bool holds(const std::string& name);
  // Absent if there is none, or if it was broken; then it is removed with one warning. A failure is a
  // shortage.
  Result<std::optional<KeptStorebag>, platform::FileFailure> read(const std::string& name);
  // Stores a storebag that was fetched now. On failure one warning is logged, and the older file stays.
  void write(const std::string& name, KeptStorebag storebag);
  // Renews the stored storebag, because the server says that it is current.
  void renew(const std::string& name, std::int32_t maxAge);
  void remove(const std::string& name, const std::string& why);

 private:
  std::string pathOf(const std::string& name) const { return _directory + "/" + name; }

  platform::FileStore& _files;
  const platform::Clock& _clock;
  const std::string _directory;
};

}  // namespace veltrad::config
