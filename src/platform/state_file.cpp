// SPDX-License-Identifier: Apache-2.0
// Queues writes of the state's text.
#include "platform/state_file.h"

#include "platform/file_store.h"
#include "platform/log.h"

namespace veltrad::platform {

namespace {
constexpr std::size_t kMostRequestBytes = 4096;
}

StateFile::StateFile(State state, FileStore& files, DiskWriter& writer, std::string path)
    : _state(std::move(state)),
      _files(files),
      _writer(writer),
      _path(std::move(path)),
      _written(_state.silent),
      _queue(writer, kMostRequestBytes) {}

bool StateFile::writeSoon() {
  const Version version = _state.version();
  {
    const Lock held(_mutex);
    if (_written == version) return true;
  }
  if (_asked.exchange(true)) return true;
  if (_queue.put([this] { write(); }, 1) == DiskWriter::Queue::Put::taken) return true;
  _asked = false;
  return false;
}

bool StateFile::writeLast(std::chrono::steady_clock::time_point deadline) {
  if (!_writer.drain(deadline)) return false;
  if (!writeSoon()) write();
  return _writer.drain(deadline);
}

void StateFile::write() {
  _asked = false;                            // first, because what changes from now on may need another write
  const Version version = _state.version();  // before the text, which may be newer
  const auto written = _files.replace(_path, _state.text(), 0644);
  if (!written && !_failed) {
    logError("%s could not be written: %s", _state.name, written.error().description.c_str());
  }
  _failed = !written;
  const Lock held(_mutex);
  _written = written ? std::optional(version) : std::nullopt;
}

}  // namespace veltrad::platform
