// SPDX-License-Identifier: Apache-2.0
// UDP with the system's socket calls.
#include "backends/dashboard/udp_socket.h"

#include <arpa/inet.h>
#include <sys/socket.h>

#include <cerrno>

namespace veltrad::backends {

namespace {
// More than a receive buffer holds.
constexpr int kMostReceivedBefore = 1024;

const sockaddr* generic(const sockaddr_in& address) {
  return reinterpret_cast<const sockaddr*>(&address);
}
}  // namespace

std::optional<sockaddr_in> parseIPv4Address(const std::string& text, std::uint16_t port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(port);
  const bool whole = text.find('\0') == std::string::npos;
  if (!whole || ::inet_pton(AF_INET, text.c_str(), &address.sin_addr) != 1) return std::nullopt;
  return address;
}

Result<UDPSocket, int> UDPSocket::open() {
  FileDescriptor socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket.isOpen()) return Failure{errno};
  return UDPSocket(std::move(socket));
}

std::optional<int> UDPSocket::bindToAnyPort() {
  sockaddr_in any{};
  any.sin_family = AF_INET;
  if (::bind(_socket.get(), generic(any), sizeof any) != 0) return errno;
  return std::nullopt;
}

std::optional<int> UDPSocket::connect(const sockaddr_in& address) {
  if (::connect(_socket.get(), generic(address), sizeof address) != 0) return errno;
  char byte = 0;
  for (int i = 0; i < kMostReceivedBefore && ::recv(_socket.get(), &byte, 1, 0) >= 0; ++i) {
  }
  return std::nullopt;
}

bool UDPSocket::send(std::string_view datagram) {
  const ssize_t sent = ::send(_socket.get(), datagram.data(), datagram.size(), MSG_NOSIGNAL);
  return sent >= 0 && static_cast<std::size_t>(sent) == datagram.size();
}

std::optional<std::size_t> UDPSocket::receive(char* buffer, std::size_t size) {
  const ssize_t received = ::recv(_socket.get(), buffer, size, 0);
  if (received < 1) return std::nullopt;
  return static_cast<std::size_t>(received);
}

}  // namespace veltrad::backends
