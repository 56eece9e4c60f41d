// Snapshots of the metrics, each taken when the disk is free for it.
#include "daemon/metrics_file.h"

#include <utility>

#include "daemon/observers.h"
#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::daemon {

namespace {
constexpr std::size_t kMostBytes = 4096;  // of requests, of which there is one
}

MetricsFile::MetricsFile(Observers& observers, platform::FileStore& files, platform::DiskWriter& writer,
                         std::string path)
    : _observers(observers), _files(files), _path(std::move(path)), _queue(writer, kMostBytes) {}

void MetricsFile::writeSoon() {
  const Gauges gauges = _observers.gauges();
  // One more than the counts' sum: the first write is due before anything was counted.
  const Numbers numbers{_observers.countsTotal() + 1, gauges.sessions, gauges.connections,
                        gauges.postsUnderWay};
  if ((numbers == _written && !_failed) || _asked.exchange(true)) return;
  _written = numbers;
  if (_queue.put([this] { write(); }, 1) == platform::DiskWriter::Queue::Put::noThread) {
    _failed = true;
    _asked = false;
  }
}

void MetricsFile::write() {
  _asked = false;  // first: what changes from now on may need a write of its own
  const auto written = _files.replace(_path, _observers.metricsText(), 0644);
  if (!written && !_failed) {
    logError("The metrics could not be written: %s", written.error().description.c_str());
  }
  _failed = !written;
}

}  // namespace veltrad::daemon
