// The adaptor's back end. The session's thread.
#include "backends/mivo/mivo_backend.h"

#include "platform/counters.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {
constexpr std::uint32_t kAllowedClientTypes = 0x2880;  // a bit a type
constexpr std::int32_t kHighestClientType = 13;
}  // namespace

bool MivoBackend::isClientTypeAllowed(std::int32_t clientType) {
  return clientType >= 0 && clientType <= kHighestClientType && (kAllowedClientTypes >> clientType & 1) != 0;
}

std::shared_ptr<MivoBackend> MivoBackend::initWithName(const BackendServices& services,
                                                       const std::string& name,
                                                       const std::string& productFamily,
                                                       std::int32_t clientType) {
  std::shared_ptr<MivoBackend> backend(new MivoBackend(services, name, productFamily));
  logInfo("MivoBackend(initWithName): Loading Mivo adaptor class for client type %d", clientType);
  if (!isClientTypeAllowed(clientType)) {
    logError("MivoBackend(initWithName): No matching bundle found for client type %d", clientType);
    return nullptr;
  }
  backend->loadAdaptor();
  return backend;
}

MivoBackend::MivoBackend(const BackendServices& services, const std::string& name,
                         const std::string& productFamily)
    : VeltraBackend(name, productFamily, services.random),
      _counters(services.counters),
      _clientBundle(services.adaptorBundle) {}

void MivoBackend::loadAdaptor() {
  std::string failure;
  const auto found = adaptorClassNamed(_clientBundle, VELTRA_ADAPTOR_CLASS);
  if (found.ok()) {
    _mivoAdaptorClass = found.value();
    _mivoAdaptor = Adaptor::make(*_mivoAdaptorClass, failure);
  } else {
    failure = found.error();
  }
  if (!_mivoAdaptor) logWarning("MivoBackend(initWithName): no Mivo adaptor: %s", failure.c_str());
}

std::optional<std::string> MivoBackend::sendMessage(const Dictionary* payload, platform::TimeValue,
                                                    std::uint16_t method, std::uint16_t respCode,
                                                    std::uint16_t, std::int32_t) {
  if (!_mivoAdaptor || !_mivoAdaptor->respondsToSelector(VELTRA_ADAPTOR_SEND)) {
    logError("MivoBackend(sendMessage): Mivo adaptor %s does not respond to forwarding selector %s",
             _mivoAdaptor ? _mivoAdaptor->description().c_str() : "(null)", VELTRA_ADAPTOR_SEND);
    _counters.count(_mivoAdaptor ? wire::Reason::adaptor_takes_none : wire::Reason::no_adaptor);
    return std::nullopt;
  }
  const auto thrown = _mivoAdaptor->perform(VELTRA_ADAPTOR_SEND, method, respCode, payload);
  if (thrown) {
    logError("MivoBackend(sendMessage): Mivo adaptor %s threw: %s", _mivoAdaptor->description().c_str(),
             thrown->c_str());
  }
  _counters.count(thrown ? wire::Reason::adaptor_threw : wire::Reason::handed_to_adaptor);
  return std::nullopt;
}

}  // namespace veltrad::backends
