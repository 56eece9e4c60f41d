// How often each thing happened to a message, by reason. Any thread.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "base/mutex.h"
#include "base/value.h"

namespace veltrad::platform {

class FileStore;

// A reason is a short text that a person can read, "message dropped: the session has no backends": what
// happened, then why. The file run/veltrad/counters.json is {"pid": n, "started": seconds since 1970,
// "counts": {reason: n}}.
class Counters {
 public:
  void count(std::string_view reason, std::uint64_t times = 1);
  std::uint64_t value(std::string_view reason) const;
  Dictionary snapshot() const;
  // Since the last time that they were written.
  bool changed() const;

  // Replaces the file (mode 0644) when something changed since the last time; where that fails, it is tried
  // again at the next call, with one error line for an episode. One thread at a time; counters_file.h.
  void writeIfChanged(FileStore& files, const std::string& path, double startedAt);

 private:
  mutable Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::map<std::string, std::uint64_t, std::less<>> _counts GUARDED_BY(_mutex);
  bool _changed GUARDED_BY(_mutex) = true;
  bool _failed GUARDED_BY(_mutex) = false;
};

}  // namespace veltrad::platform
