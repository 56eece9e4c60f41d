// Bytes and descriptors from a socket. The connection's own thread.
#pragma once

#include <deque>
#include <optional>

#include "ipc/frame.h"
#include "ipc/read_budget.h"
#include "platform/file_descriptor.h"

namespace veltrad::ipc {

// Job: reads without blocking into a FrameReader and queues the descriptors that came along, in order of
// arrival. Of descriptors that nobody asks for it keeps a few, no more.
class SocketReader {
 public:
  enum class Got {
    bytes,
    nothing,         // none for now
    end,             // the client has closed, or its socket failed
    badDescriptors,  // more than a frame can carry, or the system had no room for them
    overBudget,      // the unfinished frames of all clients hold too much
  };

  explicit SocketReader(ReadBudget& budget) : _budget(budget) {}
  ~SocketReader() { _budget.change(_held, 0); }
  SocketReader(const SocketReader&) = delete;
  SocketReader& operator=(const SocketReader&) = delete;

  Got receive(int socket);
  FrameReader::Next next(Frame& frame) { return _frames.next(frame); }
  std::optional<platform::FileDescriptor> takeDescriptor();
  // Descriptors that belong to no frame: all frames that came were taken, nothing else has begun.
  bool strayDescriptors() const { return !_descriptors.empty() && _frames.empty(); }
  // The last receive() may have left bytes in the socket, so that another one is worth its price.
  bool moreLikely() const { return _moreLikely; }

 private:
  ReadBudget& _budget;
  std::size_t _held = 0;  // what the budget knows of
  FrameReader _frames;
  std::deque<platform::FileDescriptor> _descriptors;
  std::size_t _wanted = 0;
  bool _moreLikely = true;
};

}  // namespace veltrad::ipc
