// The version's two numbers.
#include "backends/session_facts.h"

#include <cstdlib>

namespace veltrad::backends {

SelfVersion SelfVersion::of(const std::string& version) {
  const auto leadingInteger = [](const std::string& text) {
    return static_cast<std::uint8_t>(std::strtoll(text.c_str(), nullptr, 10));
  };
  const std::size_t dot = version.find('.');
  return {leadingInteger(version.substr(0, dot)),
          dot == std::string::npos ? std::uint8_t{0} : leadingInteger(version.substr(dot + 1))};
}

}  // namespace veltrad::backends
