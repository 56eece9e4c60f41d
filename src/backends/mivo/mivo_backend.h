// MivoBackend: every message goes to the adaptor that the system's bundle brings. The session's thread, which
// the adaptor holds until it has the message.
#pragma once

#include <veltra/adaptor.h>

#include <memory>
#include <string>

#include "backends/backend.h"
#include "backends/backend_factory.h"
#include "backends/mivo/adaptor.h"

namespace veltrad::backends {

// For client types 7, 11 and 13. Where the bundle or its class is missing there is a back end all the same,
// without an adaptor: each of its messages is one error line. The bundle outlives it.
class MivoBackend final : public VeltraBackend {
 public:
  // Null for a client type that has no adaptor; one error line has said so.
  static std::shared_ptr<MivoBackend> initWithName(const BackendServices& services, const std::string& name,
                                                   const std::string& productFamily, std::int32_t clientType);

  static bool isClientTypeAllowed(std::int32_t clientType);

  using VeltraBackend::sendMessage;
  // Nothing, always. Payload, method and response code are handed on as they are.
  std::optional<std::string> sendMessage(const Dictionary* payload, platform::TimeValue timestamp,
                                         std::uint16_t method, std::uint16_t respCode, std::uint16_t eventID,
                                         std::int32_t flag) override;

 private:
  MivoBackend(const BackendServices& services, const std::string& name, const std::string& productFamily);
  void loadAdaptor();

  // Constant after initialisation.
  platform::Counters& _counters;
  CodeBundle& _clientBundle;
  const veltra_adaptor_class* _mivoAdaptorClass = nullptr;
  std::unique_ptr<Adaptor> _mivoAdaptor;  // null: none could be had
};

}  // namespace veltrad::backends
