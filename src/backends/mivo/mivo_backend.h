// SPDX-License-Identifier: Apache-2.0
// MivoBackend: passes every message to the adaptor of the system's bundle, on the session's thread, which
// waits for it.
#pragma once

#include <veltra/adaptor.h>

#include <memory>
#include <string>

#include "backends/backend.h"
#include "backends/mivo/adaptor.h"

namespace veltrad::backends {

// If the bundle or its class is missing, the back end has no adaptor and logs an error for each message. The
// bundle must outlive it.
class MivoBackend final : public VeltraBackend {
 public:
  // Null, after one error line, if the client type has no adaptor.
  static std::shared_ptr<MivoBackend> initWithName(CodeBundle& bundle, platform::Counters& counters,
                                                   platform::Random& random, const std::string& name,
                                                   const std::string& productFamily, std::int32_t clientType);

  static bool isClientTypeAllowed(std::int32_t clientType) { return isAdaptorClientType(clientType); }

  // Passes on the payload, the method and the response code. Returns no text.
  Sent sendNumberedMessage(NumberedMessage&& message) override;

 private:
  MivoBackend(CodeBundle& bundle, platform::Counters& counters, platform::Random& random,
              const std::string& name, const std::string& productFamily);
  void loadAdaptor();
  Sent dropped(const NumberedMessage& message, wire::Reason why);

  platform::Counters& _counters;
  CodeBundle& _clientBundle;
  std::unique_ptr<Adaptor> _mivoAdaptor;
};

}  // namespace veltrad::backends
