// Queues writes of the counters' file.
#include "platform/counters_file.h"

#include <utility>

#include "platform/counters.h"

namespace veltrad::platform {

namespace {
constexpr std::size_t kMostRequestBytes = 4096;
}

CountersFile::CountersFile(Counters& counters, FileStore& files, DiskWriter& writer, std::string path,
                           double startedAt)
    : _counters(counters),
      _files(files),
      _writer(writer),
      _path(std::move(path)),
      _startedAt(startedAt),
      _queue(writer, kMostRequestBytes) {}

bool CountersFile::writeSoon() {
  if (!_counters.changed() || _asked.exchange(true)) return true;
  const auto write = [this] {
    _asked = false;  // first, because what is counted from now on may need another write
    _counters.writeIfChanged(_files, _path, _startedAt);
  };
  const auto put = _queue.put(write, 1);
  if (put == DiskWriter::Queue::Put::noThread) _asked = false;
  return put != DiskWriter::Queue::Put::noThread;
}

bool CountersFile::writeLast(std::chrono::steady_clock::time_point deadline) {
  if (!_writer.drain(deadline)) return false;
  if (!writeSoon()) _counters.writeIfChanged(_files, _path, _startedAt);
  return _writer.drain(deadline);
}

}  // namespace veltrad::platform
