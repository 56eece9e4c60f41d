// SPDX-License-Identifier: Apache-2.0
// DashboardBackend: sends every message as one UDP datagram to a dashboard and returns it as a text line. The
// session's thread sends and uploads; the work pool handles what waits after that (network_proc_queue.h).
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "backends/backend.h"
#include "backends/dashboard/network_proc_queue.h"
#include "backends/dashboard/reporting_packet.h"
#include "config/storebag_content.h"

namespace veltrad::backends {

class DashboardQueues;
class LogDataUploads;
class WorkPool;

// The services of a dashboard back end, and the account for its memory. The references must outlive it.
struct DashboardMaking {
  platform::Random& random;
  platform::Clock& clock;
  platform::Counters& counters;
  WorkPool& pool;
  LogDataUploads& uploads;
  std::shared_ptr<DashboardQueues> queues;
  std::shared_ptr<platform::MemoryAccount> account;
  bool oneShot = false;
  config::OwnerGate* gate = nullptr;
  platform::FateRing* fates = nullptr;
};

// The initialisers return null, after one error line, if the back end cannot work.
class DashboardBackend final : public VeltraBackend {
 public:
  // From a storebag's section: "ip" (dotted-decimal IPv4), "port" and optionally "display_url", "post_url"
  // (for log data) and "reliable". The presence of "reliable" requests acknowledgements; its value is the
  // period of the ticks in milliseconds, 500 if it is below 1.
  static std::shared_ptr<DashboardBackend> initWithName(const DashboardMaking& making,
                                                        const std::string& name,
                                                        const config::DashboardProfile* profile,
                                                        const std::string& productFamily);
  // To the given server, with acknowledgements and a period of 500 ms.
  static std::shared_ptr<DashboardBackend> initWithName(const DashboardMaking& making,
                                                        const std::string& name,
                                                        const std::optional<std::string>& serverIP,
                                                        std::uint16_t serverPort,
                                                        const std::string& productFamily);
  // A profile takes precedence over the given server.
  static std::shared_ptr<DashboardBackend> initWithName(
      const DashboardMaking& making, const std::string& name, const config::DashboardProfile* profile,
      const std::optional<std::string>& serverIP, std::uint16_t serverPort, const std::string& productFamily);
  ~DashboardBackend() override;

  // The text is the dashboard text line of the message.
  Sent sendNumberedMessage(NumberedMessage&& message) override;
  bool uploadLogData(const Array& logData, const MessageNote& note) override;
  void cleanup() override;
  std::vector<std::string> hosts() const override;
  // Waiting datagrams contain the old identifier.
  void dropIdentified() override { dropWaiting(); }

 private:
  void dropWaiting() override;

  DashboardBackend(const DashboardMaking& making, const std::string& name,
                   const config::DashboardProfile* profile, const std::string& productFamily);

  tagReportingPacketHeader headerOf(const NumberedMessage& message, const SessionFacts& facts) const;
  MessageNote notedMessage(const Dictionary& payload, platform::TimeValue now, wire::FateRef session) const;
  DatagramOwner owner(const MessageNote& note, const SessionFacts& facts) const;

  LogDataUploads& _uploads;
  platform::Clock& _clock;
  platform::Counters& _counters;
  const bool _usingProfile;
  const std::optional<std::string> _postURL;
  config::OwnerGate* const _gate;
  std::shared_ptr<NetworkProcQueue> _networkProcQueue;

  // The session's thread only.
  bool _cleanedUp = false;
  std::uint64_t _addressAt = 0;  // in the record of fates
};

}  // namespace veltrad::backends
