// DashboardBackend: every message is one UDP datagram for a dashboard and one text line for its sender. The
// session's thread sends and uploads; what waits then is the work pool's (network_proc_queue.h).
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "backends/backend.h"
#include "backends/backend_factory.h"
#include "backends/dashboard/network_proc_queue.h"
#include "backends/dashboard/reporting_packet.h"

namespace veltrad::backends {

class DashboardQueues;
class LogDataUploads;

// What a dashboard back end is made from. The services and the uploads outlive it.
struct DashboardMaking {
  const BackendServices& services;
  LogDataUploads& uploads;
  std::shared_ptr<DashboardQueues> queues;
  BackendOwner owner;
};

// Null from an initialiser: it cannot work so; one error line has said why.
class DashboardBackend final : public VeltraBackend {
 public:
  // From a storebag's section: "ip" (dotted-decimal IPv4), "port", and where given "display_url", "post_url"
  // (for log data) and "reliable": present switches acknowledgements on; its value, from 1 on, is the period
  // of the ticks in milliseconds, else 500.
  static std::shared_ptr<DashboardBackend> initWithName(const DashboardMaking& making,
                                                        const std::string& name,
                                                        const config::DashboardProfile* profile,
                                                        const std::string& productFamily);
  // To a server named outright, with acknowledgements and a period of 500 ms.
  static std::shared_ptr<DashboardBackend> initWithName(const DashboardMaking& making,
                                                        const std::string& name,
                                                        const std::optional<std::string>& serverIP,
                                                        std::uint16_t serverPort,
                                                        const std::string& productFamily);
  // A profile goes before the server named.
  static std::shared_ptr<DashboardBackend> initWithName(
      const DashboardMaking& making, const std::string& name, const config::DashboardProfile* profile,
      const std::optional<std::string>& serverIP, std::uint16_t serverPort, const std::string& productFamily);
  ~DashboardBackend() override;

  using VeltraBackend::sendMessage;
  // The dashboard text line of the message.
  std::optional<std::string> sendMessage(const Dictionary* payload, platform::TimeValue timestamp,
                                         std::uint16_t method, std::uint16_t respCode, std::uint16_t eventID,
                                         std::int32_t flag) override;
  bool uploadLogData(const Array& logData) override;
  void cleanup() override;

 private:
  DashboardBackend(const DashboardMaking& making, const std::string& name,
                   const config::DashboardProfile* profile, const std::string& productFamily);

  tagReportingPacketHeader headerOf(platform::TimeValue timestamp, std::uint16_t method,
                                    std::uint16_t respCode, std::uint16_t eventID) const;

  // Constant after initialisation.
  LogDataUploads& _uploads;
  platform::Clock& _clock;
  platform::Counters& _counters;
  const bool _usingProfile;
  const std::optional<std::string> _postURL;
  std::shared_ptr<NetworkProcQueue> _networkProcQueue;  // null: not initialised

  // The session's thread only.
  bool _cleanedUp = false;
};

}  // namespace veltrad::backends
