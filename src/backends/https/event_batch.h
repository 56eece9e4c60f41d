// The events that wait for a flush, and how many of each method. Guarded by its owner.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad {

class EventBatch {
 public:
  // Whatever the thresholds say, a batch holds no more: a storebag without limits must not grow the daemon
  // without end.
  static constexpr std::size_t kMostEvents = 4096;
  static constexpr std::size_t kMostBytes = 4u << 20;

  bool exists() const { return _exists; }
  std::size_t size() const { return _events.size(); }
  const std::vector<Dictionary>& events() const { return _events; }

  // True when an event of this method may only be added after a flush: more than `threshold` were added since
  // the counts were last cleared. Signed comparison.
  bool thresholdReached(std::int32_t method, std::int32_t threshold) const;
  // True when the bound on events or bytes is reached.
  bool full(const Dictionary& event) const;
  void add(std::int32_t method, Dictionary event);
  // The oldest one; the batch exists.
  void dropOldest();
  // After a flush that a threshold caused, an event of the method counts from 0 whatever the flush did.
  void restartCount(std::int32_t method) { _counts[method] = 0; }

  void setSessionID(const std::string& sessionID);
  // Leaves no batch; the counts go too.
  std::vector<Dictionary> take();
  // Leaves no batch; the counts stay.
  void discard();

 private:
  static std::size_t roughBytes(const Dictionary& event);

  bool _exists = false;
  std::vector<Dictionary> _events;
  std::size_t _bytes = 0;
  std::map<std::int32_t, std::int32_t> _counts;
};

}  // namespace veltrad
