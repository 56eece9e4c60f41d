// The frames of one session that wait for room in the socket. Under its connection's lock.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <string_view>

#include "client/uploaded_file.h"

namespace veltrad::client {

// Job: keeps whole frames in order and writes them without blocking. A frame counts as waiting until its last
// byte was taken.
class OutFrames {
 public:
  enum class Wrote {
    all,   // nothing waits any more
    some,  // the socket is full
    gone,  // the peer takes nothing any more
  };

  bool empty() const { return _frames.empty(); }
  std::size_t bytes() const { return _bytes; }
  std::size_t calls() const { return _frames.size(); }

  // Writes `frame` at once when nothing waits before it; what the socket does not take, waits. Where its
  // header announces a descriptor, `file` is open.
  Wrote write(int socket, std::string frame, std::shared_ptr<const UploadedFile> file = nullptr);
  // Writes what waits.
  Wrote writeWaiting(int socket);
  // Drops what waits; returns how many frames that were.
  std::uint64_t clear();
  // Frames taken whole by the socket so far.
  std::uint64_t written() const { return _written; }

 private:
  struct Waiting {
    std::string bytes;
    std::shared_ptr<const UploadedFile> file;  // null: no descriptor is to travel any more
  };

  ssize_t send(int socket);
  void taken(std::size_t count);

  std::deque<Waiting> _frames;
  std::size_t _firstTaken = 0;  // bytes of the first frame that the socket has
  std::size_t _bytes = 0;       // that wait
  std::uint64_t _written = 0;
};

}  // namespace veltrad::client
