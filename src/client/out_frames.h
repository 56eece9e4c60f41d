// The frames of one session that wait for room in the socket. Under its connection's lock.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <string_view>

#include "client/uploaded_file.h"
#include "veltra/veltra.h"

namespace veltrad::client {

// Job: keeps whole frames in order and writes them without blocking. A frame counts as waiting until its last
// byte was taken. Once the peer takes nothing any more it is stopped.
class OutFrames {
 public:
  // So many bytes may wait, or one frame.
  explicit OutFrames(std::size_t most) : _most(most) {}

  bool empty() const { return _frames.empty(); }
  std::size_t calls() const { return _frames.size(); }

  // Writes `frame` at once when nothing waits before it; what the socket does not take, waits. Where its
  // header announces a descriptor, `file` is open. VELTRA_QUEUE_FULL, or VELTRA_NO_DAEMON once it is closed
  // or stopped: it is dropped.
  veltra_status write(int socket, std::string frame, std::shared_ptr<const UploadedFile> file = nullptr);
  // Writes what waits.
  void writeWaiting(int socket);
  // Takes no more frames.
  void close() { _closed = true; }
  // The same, and drops what waits.
  void stop();

  // Frames taken whole by the socket so far.
  std::uint64_t written() const { return _written; }
  // Frames that were taken here and never written.
  std::uint64_t lost() const { return _lost; }
  // These, and those that were not taken.
  std::uint64_t dropped() const { return _refused + _lost; }

 private:
  struct Waiting {
    std::string bytes;
    std::shared_ptr<const UploadedFile> file;  // null: no descriptor is to travel any more
  };

  veltra_status refuse(veltra_status why);
  bool writeAll(int socket);
  ssize_t send(int socket);
  void taken(std::size_t count);

  const std::size_t _most;
  bool _closed = false;
  std::deque<Waiting> _frames;
  std::size_t _firstTaken = 0;  // bytes of the first frame that the socket has
  std::size_t _bytes = 0;       // that wait
  std::uint64_t _written = 0;
  std::uint64_t _refused = 0;
  std::uint64_t _lost = 0;
};

}  // namespace veltrad::client
