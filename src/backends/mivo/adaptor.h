// The adaptor of a bundle: its class found by name, one instance of it, its operations found by selector. An
// instance: one thread at a time.
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

// The class of that name, or what is wrong with the bundle. Any thread.
Result<const veltra_adaptor_class*, std::string> adaptorClassNamed(CodeBundle& bundle, std::string_view name);

// One instance. Whatever the bundle's code throws ends here.
class Adaptor {
 public:
  // Null and the reason in `failure`: the class has made none.
  static std::unique_ptr<Adaptor> make(const veltra_adaptor_class& ofClass, std::string& failure);
  ~Adaptor();
  Adaptor(const Adaptor&) = delete;
  Adaptor& operator=(const Adaptor&) = delete;

  std::string description() const;  // "<MivoAdaptor: 0x55d0c8>"
  bool respondsToSelector(std::string_view selector) const { return operationNamed(selector) != nullptr; }
  // Nothing, or what it threw. It must respond to the selector.
  std::optional<std::string> perform(std::string_view selector, std::uint16_t method, std::uint16_t respCode,
                                     const Dictionary* payload);

 private:
  Adaptor(const veltra_adaptor_class& ofClass, void* instance) : _class(ofClass), _instance(instance) {}
  const veltra_adaptor_operation* operationNamed(std::string_view selector) const;

  // Constant after construction.
  const veltra_adaptor_class& _class;
  void* const _instance;
};

}  // namespace veltrad::backends
