// The counts by reason and their file. Any thread.
#include "platform/counters.h"

#include <unistd.h>

#include "formats/json.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::platform {

void Counters::count(std::string_view reason, std::uint64_t times) {
  if (times == 0) return;
  Lock lock(_mutex);
  const auto place = _counts.lower_bound(reason);
  if (place != _counts.end() && place->first == reason) {
    place->second += times;
  } else {
    _counts.emplace_hint(place, reason, times);
  }
  _changed = true;
}

std::uint64_t Counters::value(std::string_view reason) const {
  Lock lock(_mutex);
  const auto place = _counts.find(reason);
  return place == _counts.end() ? 0 : place->second;
}

Dictionary Counters::snapshot() const {
  std::vector<Dictionary::Entry> entries;
  {
    Lock lock(_mutex);
    for (const auto& [reason, times] : _counts) entries.emplace_back(reason, times);
  }
  return Dictionary::fromEntries(std::move(entries));
}

bool Counters::changed() const {
  Lock lock(_mutex);
  return _changed;
}

void Counters::writeIfChanged(FileStore& files, const std::string& path, double startedAt) {
  bool failedBefore = false;
  {
    Lock lock(_mutex);
    if (!_changed) return;
    _changed = false;
    failedBefore = _failed;
  }
  const Dictionary all{{"pid", static_cast<int>(::getpid())}, {"started", startedAt}, {"counts", snapshot()}};
  const auto written = files.replace(path, formats::writeJSON(all) + "\n", 0644);
  if (!written && !failedBefore)
    logError("The counters could not be written: %s", written.error().description.c_str());
  Lock lock(_mutex);
  _failed = !written;
  if (!written) _changed = true;
}

}  // namespace veltrad::platform
