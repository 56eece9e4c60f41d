// SPDX-License-Identifier: Apache-2.0
// Counts what left the device in the last day, by destination. Any thread.
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

// Counts by the hour: "the last day" is the current hour and the 23 before it. The counts survive a restart
// in a separate file.
class Destinations {
 public:
  // Further destinations are counted together as "other".
  static constexpr std::size_t kMost = 256;

  // The constructor's arguments must outlive it.
  Destinations(platform::FileStore& files, const platform::Clock& clock, std::string path)
      : _files(files), _clock(clock), _path(std::move(path)) {}

  // Reads the counts from before the start. After a shortage call it again, until it succeeds.
  void load();
  // `to`: the URL, or "udp://IP:PORT"; what follows the port does not count.
  void count(http::Departure::Kind kind, std::string_view to, std::uint64_t events, std::uint64_t bytes);
  // [{"to": scheme, host and port, "events", "datagrams", "files", "logData", "bytes"}], by "to". Of very
  // many, those to which least left are one, "other", too.
  Array lastDay() const;
  // The content for the file, and a number that grows with each change of it.
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
