// A connected IPv4 UDP socket that never blocks. A plain value with one owner; any one thread at a time.
#pragma once

#include <netinet/in.h>

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/file_descriptor.h"
#include "base/result.h"

namespace veltrad::backends {

// Dotted-decimal, four numbers, nothing else: no name is resolved.
std::optional<sockaddr_in> parseIPv4Address(const std::string& text, std::uint16_t port);

// Failures are errno's numbers.
class UDPSocket {
 public:
  static Result<UDPSocket, int> open();

  // To the wildcard address and a port of the system's choice.
  std::optional<int> bindToAnyPort();
  // From then on only datagrams from this address arrive: what came before from others is discarded.
  std::optional<int> connect(const sockaddr_in& address);
  // True when the whole datagram went out. False: the buffer is full, no route, the peer refused an earlier
  // one, closed.
  bool send(std::string_view datagram);
  // The bytes of one datagram, what does not fit cut off; none when there is none, or an error was reported.
  std::optional<std::size_t> receive(char* buffer, std::size_t size);

  int descriptor() const { return _socket.get(); }
  void close() { _socket.reset(); }

 private:
  explicit UDPSocket(FileDescriptor socket) : _socket(std::move(socket)) {}
  FileDescriptor _socket;
};

}  // namespace veltrad::backends
