// SPDX-License-Identifier: Apache-2.0
// Passes messages to the adaptor.
#include "backends/mivo/mivo_backend.h"

#include "platform/counters.h"
#include "platform/log.h"

namespace veltrad::backends {

std::shared_ptr<MivoBackend> MivoBackend::initWithName(CodeBundle& bundle, platform::Counters& counters,
                                                       platform::Random& random, const std::string& name,
                                                       const std::string& productFamily,
                                                       std::int32_t clientType) {
  std::shared_ptr<MivoBackend> backend(new MivoBackend(bundle, counters, random, name, productFamily));
  logInfo("MivoBackend(initWithName): Loading Mivo adaptor class for client type %d", clientType);
  if (!isClientTypeAllowed(clientType)) {
    logError("MivoBackend(initWithName): No matching bundle found for client type %d", clientType);
    counters.count(wire::Reason::client_type_not_served);
    return nullptr;
  }
  backend->loadAdaptor();
  return backend;
}

MivoBackend::MivoBackend(CodeBundle& bundle, platform::Counters& counters, platform::Random& random,
                         const std::string& name, const std::string& productFamily)
    : VeltraBackend(name, productFamily, random), _counters(counters), _clientBundle(bundle) {}

void MivoBackend::loadAdaptor() {
  std::string failure;
  const auto found = adaptorClassNamed(_clientBundle, VELTRA_ADAPTOR_CLASS);
  if (found.ok()) {
    _mivoAdaptor = Adaptor::make(*found.value(), failure);
  } else {
    failure = found.error();
  }
  if (!_mivoAdaptor) logWarning("MivoBackend(initWithName): no Mivo adaptor: %s", failure.c_str());
}

Sent MivoBackend::sendNumberedMessage(NumberedMessage&& message) {
  if (const auto forbidden = prohibition()) {
    _counters.count(wire::Reason::backend_disabled);
    return settled(message, {wire::Fate::dropped, *forbidden});
  }
  if (!_mivoAdaptor || !_mivoAdaptor->respondsToSelector(VELTRA_ADAPTOR_SEND)) {
    logError("MivoBackend(sendMessage): Mivo adaptor %s does not respond to forwarding selector %s",
             _mivoAdaptor ? _mivoAdaptor->description().c_str() : "(null)", VELTRA_ADAPTOR_SEND);
    return dropped(message, _mivoAdaptor ? wire::Reason::adaptor_takes_none : wire::Reason::no_adaptor);
  }
  const auto thrown = _mivoAdaptor->perform(VELTRA_ADAPTOR_SEND, message.method, message.respCode,
                                            message.payload ? &*message.payload : nullptr);
  if (thrown) {
    logError("MivoBackend(sendMessage): Mivo adaptor %s threw: %s", _mivoAdaptor->description().c_str(),
             thrown->c_str());
    return dropped(message, wire::Reason::adaptor_threw);
  }
  _counters.count(wire::Reason::handed_to_adaptor);
  return settled(message, {wire::Fate::delivered, wire::Reason::always});
}

Sent MivoBackend::dropped(const NumberedMessage& message, wire::Reason why) {
  _counters.count(why);
  return settled(message, {wire::Fate::dropped, why});
}

}  // namespace veltrad::backends
