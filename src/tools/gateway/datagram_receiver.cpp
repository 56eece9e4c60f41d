// SPDX-License-Identifier: Apache-2.0
// Receives datagrams with the address that they came to, from which they are acknowledged.
#include "gateway/datagram_receiver.h"

#include <arpa/inet.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <charconv>
#include <cstdint>
#include <cstring>
#include <utility>

#include "config/client_types.h"
#include "formats/json.h"
#include "gateway/attempt.h"
#include "gateway/digest.h"
#include "platform/log.h"
#include "tools/dashboard_packet.h"

namespace veltrad::gateway {

namespace {

constexpr std::size_t kDatagramStackBytes = 256u << 10;
constexpr int kReceiveBytes = 8 << 20;
constexpr int kDatagramsAtOnce = 256;

std::optional<sockaddr_in> addressOf(const std::string& text) {
  const std::size_t colon = text.rfind(':');
  sockaddr_in address{};
  address.sin_family = AF_INET;
  std::uint16_t port = 0;
  if (colon == std::string::npos ||
      ::inet_pton(AF_INET, text.substr(0, colon).c_str(), &address.sin_addr) != 1)
    return std::nullopt;
  const char* end = text.data() + text.size();
  const auto read = std::from_chars(text.data() + colon + 1, end, port);
  if (read.ec != std::errc() || read.ptr != end) return std::nullopt;
  address.sin_port = htons(port);
  return address;
}

const char* faultName(std::string_view datagram) {
  if (datagram.size() < tools::kPacketHeaderBytes) return "too_short";
  const auto problem = tools::problemOfPacket(datagram);
  if (!problem) return nullptr;
  return problem->find("kind") == std::string::npos ? "wrong_length" : "wrong_kind";
}

// Room in a message's control part for one address of the machine, and for the number of datagrams that the
// kernel had no room for.
union Control {
  cmsghdr aligned;
  char room[CMSG_SPACE(sizeof(in_pktinfo)) + CMSG_SPACE(sizeof(std::uint32_t))];
};

// Asks for more than net.core.rmem_max, which takes a right that few have, and then for as much as it allows.
void enlargeReceiveBuffer(int socket) {
  if (::setsockopt(socket, SOL_SOCKET, SO_RCVBUFFORCE, &kReceiveBytes, sizeof kReceiveBytes) == 0) return;
  ::setsockopt(socket, SOL_SOCKET, SO_RCVBUF, &kReceiveBytes, sizeof kReceiveBytes);
  int bytes = 0;
  socklen_t length = sizeof bytes;
  // The kernel says twice what it was asked for.
  if (::getsockopt(socket, SOL_SOCKET, SO_RCVBUF, &bytes, &length) == 0 && bytes < 2 * kReceiveBytes)
    logWarning("datagrams: the receive buffer has %d bytes; net.core.rmem_max should be at least %d",
               bytes / 2, kReceiveBytes);
}

}  // namespace

Message messageOfDatagram(std::string_view datagram) {
  const Dictionary packet = tools::fieldsOfPacket(datagram);
  const auto number = [&packet](const char* key) { return packet.uint32(key).value_or(0); };
  const char* sender = config::senderCodeForComponentType(static_cast<std::int32_t>(number("componentType")));
  Dictionary fields{
      {"deviceID", *packet.find("deviceID")},
      {"sender", sender ? sender : std::to_string(number("componentType"))},
      {"sessionID", number("sessionID")},
      {"clientVersion", number("clientVersion")},
      {"category", number("method")},
      {"type", number("respCode")},
      {"eventNumber", number("eventID")},
      {"time", number("seconds") + number("timeFraction") * 4 / 1000.0},
      {"text", *packet.find("text")},
  };
  const Dictionary& items = *packet.dictionary("payload");
  // Such an object stands for a date or data, which datagrams do not have.
  if (items.size() != 1 || !(items.contains("$date") || items.contains("$data"))) fields.set("fields", items);
  return {subject::kDatagrams, digestOf("/dashboard", datagram), {}, formats::writeJSON(fields)};
}

Result<std::string, std::string> DatagramReceiver::start(const std::string& text) {
  auto address = addressOf(text);
  if (!address) return Failure{text + ": expected ADDRESS:PORT, with an IPv4 address"};
  socklen_t length = sizeof *address;
  const int yes = 1;
  _socket->descriptor.reset(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  _stopping.reset(::eventfd(0, EFD_CLOEXEC));
  const int socket = _socket->descriptor.get();
  if (socket < 0 || !_stopping.isOpen() ||
      ::setsockopt(socket, SOL_SOCKET, SO_REUSEPORT, &yes, sizeof yes) != 0 ||
      ::setsockopt(socket, IPPROTO_IP, IP_PKTINFO, &yes, sizeof yes) != 0 ||
      ::bind(socket, reinterpret_cast<sockaddr*>(&*address), length) != 0 ||
      ::getsockname(socket, reinterpret_cast<sockaddr*>(&*address), &length) != 0)
    return Failure{text + ": " + std::strerror(errno)};
  ::setsockopt(socket, SOL_SOCKET, SO_RXQ_OVFL, &yes, sizeof yes);
  enlargeReceiveBuffer(socket);
  if (!_thread.start("datagrams", kDatagramStackBytes, [this] { run(); }))
    return Failure{std::string("a thread cannot be started")};
  return text.substr(0, text.rfind(':') + 1) + std::to_string(ntohs(address->sin_port));
}

void DatagramReceiver::stop() {
  if (!_thread.running()) return;
  ::eventfd_write(_stopping.get(), 1);
  _thread.join();
}

void DatagramReceiver::run() {
  // One byte more than a datagram may have tells one that is too long.
  char room[tools::kMostPacketBytes + 1];
  pollfd watched[] = {{_socket->descriptor.get(), POLLIN, 0}, {_stopping.get(), POLLIN, 0}};
  for (;;) {
    ::poll(watched, 2, -1);
    if (watched[1].revents != 0) return;
    bool more = true;
    for (int i = 0; i < kDatagramsAtOnce && more; ++i) {
      // What there is no memory for is not acknowledged, so it comes again.
      if (!attempt([&] { more = receive(room, sizeof room); })) _metrics.datagrams.add("no_memory");
    }
  }
}

bool DatagramReceiver::receive(char* room, std::size_t size) {
  Sender sender;
  Control control{};
  iovec part{room, size};
  msghdr message{};
  message.msg_name = &sender.from;
  message.msg_namelen = sizeof sender.from;
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.room;
  message.msg_controllen = sizeof control.room;
  const ssize_t count = ::recvmsg(_socket->descriptor.get(), &message, MSG_DONTWAIT);
  if (count < 0) return false;
  for (cmsghdr* head = CMSG_FIRSTHDR(&message); head; head = CMSG_NXTHDR(&message, head)) {
    if (head->cmsg_level == IPPROTO_IP && head->cmsg_type == IP_PKTINFO) {
      in_pktinfo info{};
      std::memcpy(&info, CMSG_DATA(head), sizeof info);
      sender.at = info.ipi_addr;
    } else if (head->cmsg_level == SOL_SOCKET && head->cmsg_type == SO_RXQ_OVFL) {
      std::uint32_t dropped = 0;
      std::memcpy(&dropped, CMSG_DATA(head), sizeof dropped);
      _metrics.datagrams.add("dropped", dropped - std::exchange(_dropped, dropped));
    }
  }
  handle(sender, {room, static_cast<std::size_t>(count)});
  return true;
}

void DatagramReceiver::handle(const Sender& sender, std::string_view datagram) {
  if (const char* fault = faultName(datagram)) return _metrics.datagrams.add(fault);
  if (_socket->underWay >= _most) return _metrics.datagrams.add("no_room");
  std::string answer = tools::asksForAcknowledgement(datagram) ? tools::acknowledgementOf(datagram) : "";
  Message message = messageOfDatagram(datagram);
  Publisher::Completion completion = [socket = _socket, sender, answer = std::move(answer),
                                      &metrics = _metrics](Outcome outcome) {
    --socket->underWay;
    if (outcome != Outcome::taken) return metrics.datagrams.add(reasonOf(outcome));
    if (!answer.empty()) acknowledge(*socket, sender, answer);
    metrics.datagrams.add(answer.empty() ? "taken" : "acknowledged");
  };
  ++_socket->underWay;
  _publisher.publish(std::move(message), std::move(completion));
}

void DatagramReceiver::acknowledge(const Socket& socket, const Sender& sender, const std::string& header) {
  Control control{};
  iovec part{const_cast<char*>(header.data()), header.size()};
  msghdr message{};
  message.msg_name = const_cast<sockaddr_in*>(&sender.from);
  message.msg_namelen = sizeof sender.from;
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.room;
  message.msg_controllen = CMSG_SPACE(sizeof(in_pktinfo));
  cmsghdr* head = CMSG_FIRSTHDR(&message);
  head->cmsg_level = IPPROTO_IP;
  head->cmsg_type = IP_PKTINFO;
  head->cmsg_len = CMSG_LEN(sizeof(in_pktinfo));
  in_pktinfo info{};
  info.ipi_spec_dst = sender.at;
  std::memcpy(CMSG_DATA(head), &info, sizeof info);
  // The receiver sends the datagram again if this one is lost.
  (void)::sendmsg(socket.descriptor.get(), &message, MSG_DONTWAIT);
}

}  // namespace veltrad::gateway
