// SPDX-License-Identifier: Apache-2.0
// Reads bytes and descriptors from a socket, and charges their memory. Used by the connection's own thread.
#pragma once

#include <deque>
#include <memory>
#include <optional>

#include "base/file_descriptor.h"
#include "platform/memory_budget.h"
#include "wire/frame.h"

namespace veltrad::ipc {

// Reads without blocking into a FrameReader, and queues descriptors in the order of their arrival, up to a
// limit. The buffer is charged to the client's user as an unfinished frame before it grows; log data is
// charged as a whole call when its header arrives.
class SocketReader : private wire::FrameMemory {
 public:
  // end: the client has closed, or the socket failed. badDescriptors: too many, or the system had no room for
  // them. noRoom: the user has too much memory in use; nothing was read.
  enum class Got { bytes, nothing, end, badDescriptors, noRoom };

  // `account` may be null.
  explicit SocketReader(std::shared_ptr<platform::MemoryAccount> account)
      : _account(std::move(account)), _frames(*this) {}
  SocketReader(const SocketReader&) = delete;

  Got receive(int socket);
  wire::FrameReader::Next next(wire::Frame& frame) { return _frames.next(frame); }
  std::optional<FileDescriptor> takeDescriptor();
  // True if there are descriptors that no frame has announced.
  bool strayDescriptors() const { return !_descriptors.empty() && _frames.empty(); }
  // True if another whole frame has arrived.
  bool frameWaits() const { return _frames.frameWaits(); }
  // True if the last receive() may have left bytes in the socket.
  bool moreLikely() const { return _moreLikely; }
  // True after noRoom if unfinished frames take all memory that they may, so that waiting is useless.
  bool hopeless() const;
  // The charge for the large call that next() has just returned. It includes the buffer until rest().
  platform::Charge takeLargeCharge() { return std::move(_large); }
  // Shrinks the buffer to its content.
  void rest() { _frames.rest(); }

 private:
  bool bufferOf(std::size_t bytes) override;
  bool admitLargeCall(const wire::FrameHeader& header) override;
  bool chargeMore(std::size_t bytes);

  const std::shared_ptr<platform::MemoryAccount> _account;
  // For the buffer, and for a large call that is arriving.
  platform::Charge _charge;
  platform::Charge _large;
  wire::FrameReader _frames;
  std::deque<FileDescriptor> _descriptors;
  std::size_t _wanted = 0;
  std::size_t _lacking = 0;
  bool _moreLikely = true;
};

}  // namespace veltrad::ipc
