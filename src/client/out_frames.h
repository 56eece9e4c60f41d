// SPDX-License-Identifier: Apache-2.0
// The frames of one session that wait to be written. Used under its connection's lock.
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

// Keeps frames in order and writes them without blocking. A frame waits until its last byte is written. It
// stops when the connection has ended.
class OutFrames {
 public:
  // At most `most` bytes may wait, or one larger frame.
  explicit OutFrames(std::size_t most) : _most(most) {}

  bool empty() const { return _frames.empty(); }
  std::size_t calls() const { return _frames.size(); }

  // Writes as much of `frame` as possible if no other waits; the rest waits. If the header announces a
  // descriptor, `file` must be open. The frame is dropped if the result is VELTRA_QUEUE_FULL or, after
  // close() or stop(), VELTRA_NO_DAEMON.
  veltra_status write(int socket, std::string frame, std::shared_ptr<const UploadedFile> file = nullptr);
  // Writes as much as possible of what waits.
  void writeWaiting(int socket);
  // Accepts no more frames.
  void close() { _closed = true; }
  // The same, and drops what waits.
  void stop();

  // Frames that were written completely.
  std::uint64_t written() const { return _written; }
  // Frames that were accepted but never written.
  std::uint64_t lost() const { return _lost; }
  // These, and the frames that were not accepted.
  std::uint64_t dropped() const { return _refused + _lost; }

 private:
  struct Waiting {
    std::string bytes;
    // Null if there is no descriptor to send, or it was sent.
    std::shared_ptr<const UploadedFile> file;
  };

  veltra_status refuse(veltra_status why);
  bool writeAll(int socket);
  ssize_t send(int socket);
  void taken(std::size_t count);

  const std::size_t _most;
  bool _closed = false;
  std::deque<Waiting> _frames;
  // Bytes of the first frame that were written.
  std::size_t _firstTaken = 0;
  // Bytes that wait.
  std::size_t _bytes = 0;
  std::uint64_t _written = 0;
  std::uint64_t _refused = 0;
  std::uint64_t _lost = 0;
};

}  // namespace veltrad::client
