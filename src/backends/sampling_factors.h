// SPDX-License-Identifier: Apache-2.0
// Stable sampling factors, the same after every start. Any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace veltrad::config {
class OperatorSettings;
}  // namespace veltrad::config

namespace veltrad::platform {
class DeviceSecret;
}  // namespace veltrad::platform

namespace veltrad::backends {

// In [0, 1), spread evenly over devices: HMAC-SHA-256 under the secret over the storebag's name, a zero byte
// and the back end's name.
double stableSamplingFactor(std::string_view secret, std::string_view storebag, std::string_view backend);

// The constructor's arguments must outlive it.
class SamplingFactors {
 public:
  SamplingFactors(config::OperatorSettings& settings, platform::DeviceSecret& secret)
      : _settings(settings), _secret(secret) {}

  // Nothing: the factor is drawn, because that was chosen or because the secret cannot be read at the moment.
  std::optional<double> stableFactor(std::int32_t clientType, const std::string& backend);

 private:
  config::OperatorSettings& _settings;
  platform::DeviceSecret& _secret;
};

}  // namespace veltrad::backends
