// SPDX-License-Identifier: Apache-2.0
// An adaptor of a code bundle: its class, found by name, and an instance with its operations.
#pragma once

#include <veltra/adaptor.h>

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"
#include "base/value.h"

namespace veltrad::backends {

class CodeBundle;

// Returns the class of that name, or what is wrong with the bundle. Any thread.
Result<const veltra_adaptor_class*, std::string> adaptorClassNamed(CodeBundle& bundle, std::string_view name);

// One instance, for one thread at a time. Catches whatever the bundle's code throws.
class Adaptor {
 public:
  // Null if the class made no instance; `failure` then says why.
  static std::unique_ptr<Adaptor> make(const veltra_adaptor_class& ofClass, std::string& failure);
  ~Adaptor();
  Adaptor(const Adaptor&) = delete;
  Adaptor& operator=(const Adaptor&) = delete;

  // For example "<MivoAdaptor: 0x55d0c8>".
  std::string description() const;
  bool respondsToSelector(std::string_view selector) const { return operationNamed(selector) != nullptr; }
  // Returns what the operation threw, if it did. The adaptor must respond to the selector.
  std::optional<std::string> perform(std::string_view selector, std::uint16_t method, std::uint16_t respCode,
                                     const Dictionary* payload);

 private:
  Adaptor(const veltra_adaptor_class& ofClass, void* instance) : _class(ofClass), _instance(instance) {}
  const veltra_adaptor_operation* operationNamed(std::string_view selector) const;

  const veltra_adaptor_class& _class;
  void* const _instance;
};

}  // namespace veltrad::backends
