// SPDX-License-Identifier: Apache-2.0
// Connects a socket as a storebag's section says, and turns messages into datagrams.
#include "backends/dashboard/dashboard_backend.h"

#include <arpa/inet.h>
#include <endian.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include "backends/dashboard/dashboard_queues.h"
#include "backends/dashboard/log_data_uploads.h"
#include "backends/dashboard/text_line.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {
constexpr std::chrono::milliseconds kDefaultPeriod{500};
constexpr std::int32_t kMicrosecondsPerFraction = 4000;

bool namesServer(const config::DashboardProfile& profile) {
  const bool named = profile.ip && profile.port;
  if (!named) {
    logError("DashboardBackend(initWithName): can't resolve server %s", profile.ip ? "port" : "IP");
  }
  return named;
}

// If descriptors are short, ends queues that linger.
std::optional<UDPSocket> openSocket(DashboardQueues& queues) {
  for (;;) {
    auto socket = UDPSocket::open();
    if (socket.ok()) return std::move(socket).value();
    const bool tableIsFull = socket.error() == EMFILE || socket.error() == ENFILE;
    if (tableIsFull && queues.endOldest()) continue;
    logError("DashboardBackend(initWithName): socket() failed (%d)", socket.error());
    return std::nullopt;
  }
}

bool useReliableUDP(UDPSocket& socket) {
  const auto failure = socket.bindToAnyPort();
  if (failure) logError("DashboardBackend(useReliableUDP): can't bind socket, %d", *failure);
  return !failure;
}

// The address is missing if its text is not an address.
struct Server {
  std::optional<sockaddr_in> address;
  bool reliable = true;
  std::chrono::milliseconds period = kDefaultPeriod;

  std::string host() const {
    char text[INET_ADDRSTRLEN] = {};
    return inet_ntop(AF_INET, &address->sin_addr, text, sizeof text);
  }
  DashboardQueues::Route routeOf(const platform::MemoryAccount* account) const {
    return {address->sin_addr.s_addr, address->sin_port, reliable, period, DashboardQueues::userOf(account)};
  }
};

Server serverOf(const config::DashboardProfile* profile, const std::optional<std::string>& serverIP,
                std::uint16_t serverPort) {
  if (!profile) return {serverIP ? parseIPv4Address(*serverIP, serverPort) : std::nullopt};
  const auto [reliable, asked] = profile->reliable;
  return {parseIPv4Address(*profile->ip, *profile->port), reliable,
          asked > 0 ? std::chrono::milliseconds(asked) : kDefaultPeriod};
}

// Null after one error line.
std::shared_ptr<NetworkProcQueue> openQueue(const DashboardMaking& making, UDPSocket socket,
                                            const Server& server) {
  if (!server.address) {
    logError("DashboardBackend(initWithName): can't resolve server IP");
    making.counters.count(wire::Reason::bad_address);
    return nullptr;
  }
  const bool reliable = server.reliable && useReliableUDP(socket);
  if (socket.connect(*server.address)) {
    logError("DashboardBackend(initWithName): socket connect() failed.");
    return nullptr;
  }
  WorkPool& pool = making.pool;
  auto timer = PoolTimer::make(pool);
  if (!timer) {
    logError("DashboardBackend(initWithName): can't create timer source.");
    return nullptr;
  }
  const std::string host = server.host();
  const std::string to = "udp://" + host + ":" + std::to_string(ntohs(server.address->sin_port));
  const NetworkProcQueue::Kind kind{reliable,
                                    making.oneShot,
                                    server.period,
                                    host,
                                    to,
                                    making.gate,
                                    {making.fates, wire::kVeltraBackendDashboard}};
  auto queue = std::make_shared<NetworkProcQueue>(std::move(socket), std::move(timer), kind, making.account,
                                                  making.queues, making.counters);
  if (reliable && !queue->startReading(pool)) {
    logError("DashboardBackend(useReliableUDP): can't create read source");
  }
  if (kind.shared) making.queues->share(server.routeOf(making.account.get()), queue);
  return queue;
}
}  // namespace

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(const DashboardMaking& making,
                                                                 const std::string& name,
                                                                 const config::DashboardProfile* profile,
                                                                 const std::string& productFamily) {
  return initWithName(making, name, profile, std::nullopt, 0, productFamily);
}

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(const DashboardMaking& making,
                                                                 const std::string& name,
                                                                 const std::optional<std::string>& serverIP,
                                                                 std::uint16_t serverPort,
                                                                 const std::string& productFamily) {
  if (!serverIP) return nullptr;
  return initWithName(making, name, nullptr, serverIP, serverPort, productFamily);
}

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(
    const DashboardMaking& making, const std::string& name, const config::DashboardProfile* profile,
    const std::optional<std::string>& serverIP, std::uint16_t serverPort, const std::string& productFamily) {
  if (profile && !namesServer(*profile)) {
    making.counters.count(wire::Reason::bad_address);
    return nullptr;
  }
  const Server server = serverOf(profile, serverIP, serverPort);
  auto queue =
      making.oneShot && server.address ? making.queues->join(server.routeOf(making.account.get())) : nullptr;
  auto socket = queue ? std::nullopt : openSocket(*making.queues);
  if (!queue && !socket) return nullptr;
  std::shared_ptr<DashboardBackend> backend(new DashboardBackend(making, name, profile, productFamily));
  if (profile) backend->setDisplayURL(profile->displayURL);
  if (!profile && !serverIP) {
    logError("DashboardBackend(initWithName): initWitName with all null params.");
    return nullptr;
  }
  if (!queue) queue = openQueue(making, std::move(*socket), server);
  backend->_networkProcQueue = std::move(queue);
  return backend->_networkProcQueue ? backend : nullptr;
}

DashboardBackend::DashboardBackend(const DashboardMaking& making, const std::string& name,
                                   const config::DashboardProfile* profile, const std::string& productFamily)
    : VeltraBackend(name, productFamily, making.random),
      _uploads(making.uploads),
      _clock(making.clock),
      _counters(making.counters),
      _usingProfile(profile != nullptr),
      _postURL(profile ? profile->postURL : std::nullopt),
      _gate(making.gate) {}

DatagramOwner DashboardBackend::owner(const MessageNote& note, const SessionFacts& facts) const {
  if (!_gate || !_gate->keepsRecords()) return {facts.client, {}};
  return {facts.client,
          aboutDeparture(name(), facts, std::nullopt, note.edits ? *note.edits : config::EditedFields())};
}

std::vector<std::string> DashboardBackend::hosts() const {
  return {_networkProcQueue->host()};
}

void DashboardBackend::dropWaiting() {
  _networkProcQueue->dropWaiting();
}

DashboardBackend::~DashboardBackend() {
  cleanup();
}

Sent DashboardBackend::sendNumberedMessage(NumberedMessage&& message) {
  if (const auto forbidden = prohibition()) {
    _counters.count(wire::Reason::backend_disabled);
    return settled(message, {wire::Fate::dropped, *forbidden});
  }
  const SharedFacts facts = this->facts();
  tagReportingPacket packet;
  packet.header = headerOf(message, *facts);
  PacketText text(packet.text);
  if (message.payload) text.append(*message.payload);
  if (text.cut()) _counters.count(wire::Reason::datagram_cut);
  const std::size_t length = sizeof packet.header + text.length();
  packet.header.invertedLength = htobe16(static_cast<std::uint16_t>(~length));

  std::string line = writeLocalLog(packet);
  const std::string_view datagram{reinterpret_cast<const char*>(&packet), length};
  wire::StepEntry fate = stepOf(message);
  fate.text = pen().textOf(_networkProcQueue->address(), _addressAt);
  fate.bytes = static_cast<std::uint32_t>(length);
  return {_networkProcQueue->tryToSendMsg(datagram, message.eventID, owner(message.note, *facts), fate),
          std::move(line)};
}

tagReportingPacketHeader DashboardBackend::headerOf(const NumberedMessage& message,
                                                    const SessionFacts& facts) const {
  const std::string& udid = facts.device.udid;
  const platform::TimeValue time = message.timestamp;
  tagReportingPacketHeader header{};
  header.versionMajor = facts.selfVersion.major;
  header.componentType = static_cast<std::uint8_t>(facts.compType);
  header.kind = kPacketKind;
  header.timeFraction = static_cast<std::uint8_t>(time.microseconds / kMicrosecondsPerFraction);
  header.seconds = htobe32(static_cast<std::uint32_t>(time.seconds));
  header.invertedSessionID = htobe32(~facts.sessionID);
  header.invertedClientVersion = htobe16(static_cast<std::uint16_t>(~facts.clientVersion));
  header.method = htobe16(message.method);
  header.respCode = htobe16(message.respCode);
  std::memcpy(header.deviceID, udid.data(), std::min(udid.size(), sizeof header.deviceID));
  header.eventID = htobe16(message.eventID);
  header.flags =
      htobe16(static_cast<std::uint16_t>((_networkProcQueue->reliableUDP() ? kPacketFlagReliable : 0) |
                                         (_usingProfile ? 0 : kPacketFlagNoProfile)));
  return header;
}

bool DashboardBackend::uploadLogData(const Array& logData, const MessageNote& note) {
  const wire::StepEntry fate = stepOf(note);
  if (prohibition()) {
    _counters.count(wire::Reason::log_data_refused_by_owner);
    pen().write(wire::Step::dropped, wire::Reason::log_data_refused_by_owner, fate);
    return false;
  }
  const auto location = _uploads.upload(_postURL, logData, owner(note, *facts()), pen(), fate);
  if (!location) return false;
  const Dictionary payload{{"LogDataUploadLocation", *location}};
  const platform::TimeValue now = _clock.now();
  sendMessage(payload, now, 0, 2, 0, notedMessage(payload, now, note.session));
  return true;
}

// The message is of this back end alone.
MessageNote DashboardBackend::notedMessage(const Dictionary& payload, platform::TimeValue now,
                                           wire::FateRef session) const {
  if (!pen().writes()) return {};
  wire::MessageEntry entry;
  entry.from = wire::MessageEntry::From::session;
  entry.session = session;
  entry.message = pen().ring()->nextMessage();
  entry.time = platform::FateRing::microseconds(now);
  entry.type = 2;
  pen().ring()->contents().keep(entry.message, &payload, nullptr);
  pen().ring()->write(entry);
  return {nullptr, entry.message, session};
}

void DashboardBackend::cleanup() {
  if (!_networkProcQueue || std::exchange(_cleanedUp, true)) return;
  _networkProcQueue->cleanup();
}

}  // namespace veltrad::backends
