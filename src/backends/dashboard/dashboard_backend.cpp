// The dashboard back end: from a storebag's section to a connected socket, from a message to a datagram.
#include "backends/dashboard/dashboard_backend.h"

#include <endian.h>

#include <algorithm>
#include <cstring>

#include "backends/dashboard/log_data_uploads.h"
#include "backends/dashboard/text_line.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/log.h"

namespace veltrad {

namespace {
constexpr std::chrono::milliseconds kDefaultPeriod{500};
constexpr std::int32_t kMicrosecondsPerFraction = 4000;

std::optional<std::string> textOf(const Dictionary* profile, std::string_view key) {
  const std::string* text = profile ? profile->string(key) : nullptr;
  return text ? std::optional(*text) : std::nullopt;
}

std::chrono::milliseconds periodOf(const Dictionary* profile) {
  const std::int32_t asked = profile ? profile->int32("reliable").value_or(0) : 0;
  return asked > 0 ? std::chrono::milliseconds(asked) : kDefaultPeriod;
}

std::optional<sockaddr_in> addressOf(const std::string& ip, std::uint16_t port) {
  const auto address = platform::parseIPv4Address(ip, port);
  if (!address) logError("DashboardBackend(initWithName): can't resolve server IP");
  return address;
}

// Of the section's server.
std::optional<sockaddr_in> addressOf(const Dictionary& profile) {
  const std::string* ip = profile.string("ip");
  if (!ip) {
    logError("DashboardBackend(initWithName): can't resolve server IP");
    return std::nullopt;
  }
  const auto port = profile.uint16("port");
  if (!port) {
    logError("DashboardBackend(initWithName): can't resolve server port");
    return std::nullopt;
  }
  return addressOf(*ip, *port);
}
}  // namespace

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(const BackendServices& services,
                                                                 LogDataUploads& uploads,
                                                                 const std::string& name,
                                                                 const Dictionary* profile,
                                                                 const std::string& productFamily) {
  const auto port = profile ? profile->uint16("port").value_or(0) : std::uint16_t{0};
  return initWithName(services, uploads, name, profile, textOf(profile, "ip"), port, productFamily);
}

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(
    const BackendServices& services, LogDataUploads& uploads, const std::string& name,
    const std::optional<std::string>& serverIP, std::uint16_t serverPort, const std::string& productFamily) {
  if (!serverIP) return nullptr;
  return initWithName(services, uploads, name, nullptr, serverIP, serverPort, productFamily);
}

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(
    const BackendServices& services, LogDataUploads& uploads, const std::string& name,
    const Dictionary* profile, const std::optional<std::string>& serverIP, std::uint16_t serverPort,
    const std::string& productFamily) {
  auto network = openNetwork(services, profile, serverIP, serverPort);
  if (!network) return nullptr;
  std::shared_ptr<DashboardBackend> backend(
      new DashboardBackend(services, uploads, name, profile, productFamily, std::move(*network)));
  backend->setDisplayURL(textOf(profile, "display_url"));
  return backend;
}

DashboardBackend::DashboardBackend(const BackendServices& services, LogDataUploads& uploads,
                                   const std::string& name, const Dictionary* profile,
                                   const std::string& productFamily, Network network)
    : VeltraBackend(name, profile ? *profile : Dictionary{}, productFamily, services.random),
      _uploads(uploads),
      _clock(services.clock),
      _counters(services.counters),
      _reliableUDP(network.reliableUDP),
      _usingProfile(profile != nullptr),
      _postURL(textOf(profile, "post_url")),
      _networkProcQueue(std::move(network.queue)) {}

DashboardBackend::~DashboardBackend() {
  _networkProcQueue->cleanup();
}

std::optional<DashboardBackend::Network> DashboardBackend::openNetwork(
    const BackendServices& services, const Dictionary* profile, const std::optional<std::string>& serverIP,
    std::uint16_t serverPort) {
  if (!profile && !serverIP) {
    logError("DashboardBackend(initWithName): initWitName with all null params.");
    return std::nullopt;
  }
  const auto address = profile ? addressOf(*profile) : addressOf(*serverIP, serverPort);
  if (!address) return std::nullopt;
  auto socket = platform::UDPSocket::open();
  if (!socket.ok()) {
    logError("DashboardBackend(initWithName): socket() failed (%d)", socket.error());
    return std::nullopt;
  }
  Network network;
  if (!profile || profile->contains("reliable")) network.reliableUDP = useReliableUDP(socket.value());
  if (socket.value().connect(*address)) {
    logError("DashboardBackend(initWithName): socket connect() failed.");
    return std::nullopt;
  }
  auto timer = platform::PoolTimer::make(services.pool);
  if (!timer) {
    logError("DashboardBackend(initWithName): can't create timer source.");
    return std::nullopt;
  }
  network.queue = std::make_shared<NetworkProcQueue>(
      std::move(socket).value(), std::move(timer), network.reliableUDP, periodOf(profile), services.counters);
  if (network.reliableUDP && !network.queue->startReading(services.pool)) {
    logError("DashboardBackend(useReliableUDP): can't create read source");
  }
  return network;
}

bool DashboardBackend::useReliableUDP(platform::UDPSocket& socket) {
  const auto failure = socket.bindToAnyPort();
  if (failure) logError("DashboardBackend(useReliableUDP): can't bind socket, %d", *failure);
  return !failure;
}

std::optional<std::string> DashboardBackend::sendMessage(const Dictionary* payload,
                                                         platform::TimeValue timestamp, std::uint16_t method,
                                                         std::uint16_t respCode, std::uint16_t eventID,
                                                         std::int32_t) {
  tagReportingPacket packet;
  packet.header = headerOf(timestamp, method, respCode, eventID);
  PacketText text(packet.text);
  if (payload) text.append(*payload);
  if (text.cut()) _counters.count("datagram cut: its text is longer than 1023 bytes");
  const std::size_t length = sizeof packet.header + text.length();
  packet.header.invertedLength = htobe16(static_cast<std::uint16_t>(~length));

  std::string line = writeLocalLog(packet);
  _networkProcQueue->tryToSendMsg({reinterpret_cast<const char*>(&packet), length}, eventID);
  return line;
}

tagReportingPacketHeader DashboardBackend::headerOf(platform::TimeValue timestamp, std::uint16_t method,
                                                    std::uint16_t respCode, std::uint16_t eventID) const {
  tagReportingPacketHeader header{};
  header.versionMajor = selfVersionMajor();
  header.componentType = static_cast<std::uint8_t>(compType());
  header.kind = kPacketKind;
  header.timeFraction = static_cast<std::uint8_t>(timestamp.microseconds / kMicrosecondsPerFraction);
  header.seconds = htobe32(static_cast<std::uint32_t>(timestamp.seconds));
  header.invertedSessionID = htobe32(~sessionID());
  header.invertedClientVersion = htobe16(static_cast<std::uint16_t>(~clientVersion()));
  header.method = htobe16(method);
  header.respCode = htobe16(respCode);
  std::memcpy(header.deviceID, udid().data(), std::min(udid().size(), sizeof header.deviceID));
  header.eventID = htobe16(eventID);
  header.flags = htobe16(static_cast<std::uint16_t>((_reliableUDP ? kPacketFlagReliable : 0) |
                                                    (_usingProfile ? 0 : kPacketFlagNoProfile)));
  return header;
}

bool DashboardBackend::uploadLogData(const Array& logData) {
  const auto location = _uploads.upload(_postURL, logData);
  if (!location) return false;
  const Dictionary payload{{"LogDataUploadLocation", *location}};
  sendMessage(&payload, _clock.now(), 0, 2, 0);
  return true;
}

void DashboardBackend::cleanup() {
  _networkProcQueue->cleanup();
}

}  // namespace veltrad
