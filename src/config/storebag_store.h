// SPDX-License-Identifier: Apache-2.0
// Storebags that survive a restart: a file a name, as they were downloaded. Any thread.
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

// DIRECTORY/NAME (mode 0600, the directory 0700 and made when needed) is a property list of
// {"container", "lastModified", "maxAge", "fetchTime"}. Nothing in it is vouched for but by the container's
// own signature. One thread at a time for a name. What the constructor takes outlives it.
class StorebagStore {
 public:
  StorebagStore(platform::FileStore& files, const platform::Clock& clock, std::string directory)
      : _files(files), _clock(clock), _directory(std::move(directory)) {}

  bool holds(const std::string& name);
  // Nothing: none is there, or it was broken and is removed, which one warning says. A failure is a shortage.
  Result<std::optional<KeptStorebag>, platform::FileFailure> read(const std::string& name);
  // As fetched now. What cannot be written is one warning, and the older file stays.
  void write(const std::string& name, KeptStorebag storebag);
  // The server says that what is there is current.
  void renew(const std::string& name, std::int32_t maxAge);
  void remove(const std::string& name, const std::string& why);

 private:
  std::string pathOf(const std::string& name) const { return _directory + "/" + name; }

  platform::FileStore& _files;
  const platform::Clock& _clock;
  const std::string _directory;
};

}  // namespace veltrad::config
