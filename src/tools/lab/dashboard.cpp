// SPDX-License-Identifier: Apache-2.0
// Receives and acknowledges datagrams.
#include "dashboard.h"

#include <arpa/inet.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "tools/dashboard_packet.h"

namespace veltrad::lab {

using tools::acknowledgementOf;
using tools::asksForAcknowledgement;
using tools::kPacketHeaderBytes;

namespace {

constexpr std::size_t kLargestDatagram = 65'536;
constexpr int kReceiveBufferBytes = 8 << 20;
constexpr int kDatagramsAtOnce = 256;
constexpr std::size_t kMostDelayed = 100'000;
// Ends inside the event number.
constexpr std::size_t kShortBytes = 61;
constexpr std::size_t kLongBytes = 2000;
constexpr std::uint16_t kForeignOffset = 0x4000;
// How long a held acknowledgement waits for the next one.
constexpr std::chrono::milliseconds kLongestHold{1000};

FileDescriptor boundSocket(int port, int& boundPort) {
  FileDescriptor made(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  address.sin_port = htons(static_cast<std::uint16_t>(port));
  socklen_t length = sizeof address;
  if (!made.isOpen() || ::bind(made.get(), reinterpret_cast<sockaddr*>(&address), length) != 0 ||
      ::getsockname(made.get(), reinterpret_cast<sockaddr*>(&address), &length) != 0)
    return {};
  boundPort = ntohs(address.sin_port);
  return made;
}

std::string textOf(const sockaddr_in& address) {
  char text[INET_ADDRSTRLEN] = "";
  ::inet_ntop(AF_INET, &address.sin_addr, text, sizeof text);
  return text + (":" + std::to_string(ntohs(address.sin_port)));
}

// In the order of Rule::Acknowledgement.
constexpr const char* kOutcomes[] = {"acknowledged",
                                     "acknowledgement dropped",
                                     "acknowledged twice",
                                     "acknowledged behind the next one",
                                     "acknowledgement too short",
                                     "acknowledgement too long",
                                     "another event acknowledged",
                                     "acknowledged from another port"};
static_assert(std::size(kOutcomes) == static_cast<std::size_t>(Rule::Acknowledgement::stranger) + 1);

const char* outcomeOf(std::string_view datagram, const Rule& rule) {
  if (datagram.size() < kPacketHeaderBytes) return "not acknowledged: no whole header";
  if (!asksForAcknowledgement(datagram)) return "not acknowledged: not asked for";
  if (rule.acknowledgement == Rule::Acknowledgement::right && rule.delay.count() > 0) {
    return "acknowledged late";
  }
  return kOutcomes[static_cast<std::size_t>(rule.acknowledgement)];
}

}  // namespace

std::optional<std::string> Dashboard::start(int port) {
  int strangersPort = 0;
  _socket = boundSocket(port, _port);
  if (!_socket.isOpen())
    return "the dashboard's UDP port " + std::to_string(port) + " cannot be bound: " + std::strerror(errno) +
           "; --dashboard-port 0 takes any free one";
  _stranger = boundSocket(0, strangersPort);
  _stopping.reset(::eventfd(0, EFD_CLOEXEC));
  if (!_stranger.isOpen() || !_stopping.isOpen())
    return std::string("the dashboard could not be set up: ") + std::strerror(errno);
  ::setsockopt(_socket.get(), SOL_SOCKET, SO_RCVBUF, &kReceiveBufferBytes, sizeof kReceiveBufferBytes);
  _thread = std::thread([this] { run(); });
  return std::nullopt;
}

void Dashboard::stop() {
  if (!_thread.joinable()) return;
  ::eventfd_write(_stopping.get(), 1);
  _thread.join();
}

void Dashboard::run() {
  pollfd watched[] = {{_socket.get(), POLLIN, 0}, {_stopping.get(), POLLIN, 0}};
  for (;;) {
    ::poll(watched, 2, millisecondsToNext());
    if (watched[1].revents != 0) return;
    if (watched[0].revents != 0) receive();
    sendWhatIsDue();
  }
}

int Dashboard::millisecondsToNext() const {
  if (_delayed.empty() && !_held) return -1;
  Time next = _held ? _heldUntil : Time::max();
  if (!_delayed.empty()) next = std::min(next, _delayed.begin()->first);
  const auto left =
      std::chrono::ceil<std::chrono::milliseconds>(next - std::chrono::steady_clock::now()).count();
  return static_cast<int>(std::max<std::int64_t>(left, 0));
}

void Dashboard::sendWhatIsDue() {
  const Time present = std::chrono::steady_clock::now();
  while (!_delayed.empty() && _delayed.begin()->first <= present)
    send(_delayed.extract(_delayed.begin()).mapped());
  if (_held && _heldUntil <= present) sendHeld();
}

void Dashboard::receive() {
  static thread_local char buffer[kLargestDatagram];
  for (int i = 0; i < kDatagramsAtOnce; ++i) {
    sockaddr_in from{};
    socklen_t length = sizeof from;
    const ssize_t count = ::recvfrom(_socket.get(), buffer, sizeof buffer, MSG_DONTWAIT,
                                     reinterpret_cast<sockaddr*>(&from), &length);
    if (count < 0) return;
    handle(from, {buffer, static_cast<std::size_t>(count)});
  }
}

void Dashboard::handle(const sockaddr_in& from, std::string_view datagram) {
  const Rule rule = _misbehaviour.take(kDashboardPath).value_or(Rule());
  Dictionary line = tools::fieldsOfPacket(datagram);
  line.set("time", secondsNow());
  line.set("from", textOf(from));
  line.set("bytes", std::uint64_t{datagram.size()});
  line.set("outcome", outcomeOf(datagram, rule));
  _lines.add(line, {});
  if (asksForAcknowledgement(datagram)) acknowledge(from, datagram, rule);
}

void Dashboard::acknowledge(const sockaddr_in& from, std::string_view datagram, const Rule& rule) {
  using Kind = Rule::Acknowledgement;
  const Kind how = rule.acknowledgement;
  if (how == Kind::dropped) return;
  Acknowledgement made{from, acknowledgementOf(datagram, how == Kind::foreign ? kForeignOffset : 0),
                       how == Kind::stranger ? _stranger.get() : _socket.get()};
  if (how == Kind::tooShort) made.bytes.resize(kShortBytes);
  if (how == Kind::tooLong) made.bytes.resize(kLongBytes, 'x');
  if (how == Kind::reordered && !_held) {
    _heldUntil = std::chrono::steady_clock::now() + kLongestHold;
    _held = std::move(made);
    return;
  }
  for (int copies = how == Kind::duplicate ? 2 : 1; copies > 0; --copies) {
    if (rule.delay.count() == 0)
      send(made);
    else if (_delayed.size() < kMostDelayed)
      _delayed.emplace(std::chrono::steady_clock::now() + rule.delay, made);
  }
}

void Dashboard::send(const Acknowledgement& acknowledgement) {
  // The receiver may have gone.
  (void)::sendto(acknowledgement.socket, acknowledgement.bytes.data(), acknowledgement.bytes.size(), 0,
                 reinterpret_cast<const sockaddr*>(&acknowledgement.to), sizeof acknowledgement.to);
  sendHeld();
}

void Dashboard::sendHeld() {
  if (const auto held = std::exchange(_held, std::nullopt)) send(*held);
}

}  // namespace veltrad::lab
