// SPDX-License-Identifier: Apache-2.0
// Reads the table of an adaptor bundle and calls its functions.
#include "backends/mivo/adaptor.h"

#include <fmt/format.h>

#include <exception>

#include "backends/mivo/adaptor_payload.h"
#include "backends/mivo/code_bundle.h"
#include "platform/log.h"

namespace veltrad::backends {

namespace {

constexpr const char* kTable = "veltra_adaptor";

// Returns what `call` threw, if it did.
template <typename Call>
std::optional<std::string> thrownBy(Call call) {
  try {
    call();
  } catch (const std::exception& exception) {
    return exception.what();
  } catch (...) {
    return "an exception without a text";
  }
  return std::nullopt;
}

}  // namespace

Result<const veltra_adaptor_class*, std::string> adaptorClassNamed(CodeBundle& bundle,
                                                                   std::string_view name) {
  const auto object = bundle.object(kTable);
  if (!object.ok()) return Failure{object.error()};
  const auto& table = *static_cast<const veltra_adaptor_bundle*>(object.value());
  if (table.version != VELTRA_ADAPTOR_VERSION) {
    return Failure{fmt::format("{}: an adaptor of version {}, expected {}", bundle.file(), table.version,
                               VELTRA_ADAPTOR_VERSION)};
  }
  for (std::size_t i = 0; i < table.class_count; ++i) {
    if (table.classes[i].name == name) return &table.classes[i];
  }
  return Failure{fmt::format("{}: no class {} among its {}", bundle.file(), name, table.class_count)};
}

std::unique_ptr<Adaptor> Adaptor::make(const veltra_adaptor_class& ofClass, std::string& failure) {
  void* instance = nullptr;
  const auto thrown = thrownBy([&] { instance = ofClass.create(); });
  if (thrown) failure = fmt::format("creating a {} threw: {}", ofClass.name, *thrown);
  if (!thrown && !instance) failure = fmt::format("{} has made no instance", ofClass.name);
  if (!instance) return nullptr;
  return std::unique_ptr<Adaptor>(new Adaptor(ofClass, instance));
}

Adaptor::~Adaptor() {
  if (const auto thrown = thrownBy([this] { _class.destroy(_instance); })) {
    logError("MivoBackend(dealloc): Mivo adaptor %s threw: %s", description().c_str(), thrown->c_str());
  }
}

std::string Adaptor::description() const {
  return fmt::format("<{}: {}>", _class.name, fmt::ptr(_instance));
}

const veltra_adaptor_operation* Adaptor::operationNamed(std::string_view selector) const {
  for (std::size_t i = 0; i < _class.operation_count; ++i) {
    if (_class.operations[i].selector == selector) return &_class.operations[i];
  }
  return nullptr;
}

std::optional<std::string> Adaptor::perform(std::string_view selector, std::uint16_t method,
                                            std::uint16_t respCode, const Dictionary* payload) {
  const veltra_adaptor_operation& operation = *operationNamed(selector);
  const AdaptorPayload seen(payload);
  return thrownBy([&] { operation.function(_instance, method, respCode, seen.dictionary()); });
}

}  // namespace veltrad::backends
