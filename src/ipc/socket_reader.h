// Bytes and descriptors from a socket, and who pays for them. The connection's own thread.
#pragma once

#include <deque>
#include <memory>
#include <optional>

#include "base/file_descriptor.h"
#include "platform/memory_budget.h"
#include "wire/frame.h"

namespace veltrad::ipc {

// Job: reads without blocking into a FrameReader and queues the descriptors that came along, in order of
// arrival. Of descriptors that nobody asks for it keeps a few, no more. The buffer is charged to the client's
// user before it grows, as the bytes of an unfinished frame; log data as a whole call, when its header comes.
class SocketReader : private wire::FrameMemory {
 public:
  enum class Got {
    bytes,
    nothing,         // none for now
    end,             // the client has closed, or its socket failed
    badDescriptors,  // more than a frame can carry, or the system had no room for them
    noRoom,          // its user keeps too much just now; nothing was read
  };

  // A null account pays for everything.
  explicit SocketReader(std::shared_ptr<platform::MemoryAccount> account)
      : _account(std::move(account)), _frames(*this) {}
  SocketReader(const SocketReader&) = delete;
  SocketReader& operator=(const SocketReader&) = delete;

  Got receive(int socket);
  wire::FrameReader::Next next(wire::Frame& frame) { return _frames.next(frame); }
  std::optional<FileDescriptor> takeDescriptor();
  // Descriptors that belong to no frame: all frames that came were taken, nothing else has begun.
  bool strayDescriptors() const { return !_descriptors.empty() && _frames.empty(); }
  // The last receive() may have left bytes in the socket, so that another one is worth its price.
  bool moreLikely() const { return _moreLikely; }
  // After noRoom: unfinished frames hold all that they may, so that waiting is of no use.
  bool hopeless() const;
  // What was charged for the large call that next() has just handed out. The buffer is part of it until
  // rest().
  platform::Charge takeLargeCharge() { return std::move(_large); }
  // The buffer shrinks to what is in it.
  void rest() { _frames.rest(); }

 private:
  bool bufferOf(std::size_t bytes) override;
  bool admitLargeCall(const wire::FrameHeader& header) override;
  bool chargeMore(std::size_t bytes);

  const std::shared_ptr<platform::MemoryAccount> _account;
  platform::Charge _charge;  // the buffer's
  platform::Charge _large;   // of a large call that is coming
  wire::FrameReader _frames;
  std::deque<FileDescriptor> _descriptors;
  std::size_t _wanted = 0;
  std::size_t _lacking = 0;
  bool _moreLikely = true;
};

}  // namespace veltrad::ipc
