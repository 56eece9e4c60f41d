// SPDX-License-Identifier: Apache-2.0
// A connected IPv4 UDP socket that never blocks.
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

// Takes the dotted-decimal form only; names are not resolved.
std::optional<sockaddr_in> parseIPv4Address(const std::string& text, std::uint16_t port);

// Failures are values of errno.
class UDPSocket {
 public:
  static Result<UDPSocket, int> open();

  // Binds to the wildcard address and a port that the system chooses.
  std::optional<int> bindToAnyPort();
  // Then only datagrams from this address arrive; those that arrived earlier are discarded.
  std::optional<int> connect(const sockaddr_in& address);
  // Returns whether the whole datagram was sent.
  bool send(std::string_view datagram);
  // Returns the length of one datagram, cut at `size`. Nothing if there is no datagram or an error was
  // reported.
  std::optional<std::size_t> receive(char* buffer, std::size_t size);

  int descriptor() const { return _socket.get(); }
  void close() { _socket.reset(); }

 private:
  explicit UDPSocket(FileDescriptor socket) : _socket(std::move(socket)) {}
  FileDescriptor _socket;
};

}  // namespace veltrad::backends
