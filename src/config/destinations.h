// SPDX-License-Identifier: Apache-2.0
// What has left in the last day, by destination. Any thread.
#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"
#include "http/request_gate.h"

namespace veltrad::platform {
class Clock;
class FileStore;
}  // namespace veltrad::platform

namespace veltrad::config {

// Counts by the hour, so that "the last day" is the hour that runs and the 23 before. Kept over a restart in
// a file of its own.
class Destinations {
 public:
  // Beyond so many, all others are one, "other".
  static constexpr std::size_t kMost = 256;

  // What the constructor takes outlives it.
  Destinations(platform::FileStore& files, const platform::Clock& clock, std::string path)
      : _files(files), _clock(clock), _path(std::move(path)) {}

  // Reads what was counted before the start. A shortage passes: to be called again until it has been read.
  void load();
  // `to`: the URL, or "udp://IP:PORT"; what follows the port does not count.
  void count(http::Departure::Kind kind, std::string_view to, std::uint64_t events, std::uint64_t bytes);
  // [{"to": scheme, host and port, "events", "datagrams", "files", "logData", "bytes"}], by "to". Of very
  // many, those to which least left are one, "other", too.
  Array lastDay() const;
  // What the file is to hold, and a number that grows when that changes.
  std::string text() const;
  std::uint64_t version() const;

 private:
  enum Column : std::size_t { events, datagrams, files, logData, bytes, columns };
  static constexpr const char* kColumns[] = {"events", "datagrams", "files", "logData", "bytes"};
  using Counts = std::array<std::uint64_t, columns>;
  using ByAddress = std::map<std::string, Counts, std::less<>>;

  static void joinSmallest(ByAddress& sums);
  std::int64_t hour() const;
  void forgetOld() REQUIRES(_mutex);
  Counts& countsOf(std::int64_t hour, std::string_view address) REQUIRES(_mutex);

  platform::FileStore& _files;
  const platform::Clock& _clock;
  const std::string _path;

  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  bool _loaded GUARDED_BY(_mutex) = false;
  // By hour since 1970.
  std::map<std::int64_t, ByAddress> _hours GUARDED_BY(_mutex);
  std::uint64_t _version GUARDED_BY(_mutex) = 0;
};

}  // namespace veltrad::config
