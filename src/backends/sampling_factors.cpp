// SPDX-License-Identifier: Apache-2.0
// The digest behind a stable sampling factor. Any thread.
#include "backends/sampling_factors.h"

#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <cmath>
#include <cstdlib>

#include "config/client_types.h"
#include "config/operator_settings.h"
#include "platform/device_secret.h"

namespace veltrad::backends {

double stableSamplingFactor(std::string_view secret, std::string_view storebag, std::string_view backend) {
  std::string text(storebag);
  text.push_back('\0');
  text.append(backend);
  unsigned char digest[32];
  unsigned length = 0;
  if (HMAC(EVP_sha256(), secret.data(), static_cast<int>(secret.size()),
           reinterpret_cast<const unsigned char*>(text.data()), text.size(), digest, &length) == nullptr)
    std::abort();
  std::uint64_t bits = 0;
  for (int i = 0; i < 8; ++i) bits = bits << 8 | digest[i];
  return std::ldexp(static_cast<double>(bits >> 11), -53);  // as many bits as a double holds
}

std::optional<double> SamplingFactors::stableFactor(std::int32_t clientType, const std::string& backend) {
  const auto choices = _settings.current();
  if (!choices || choices->sampling != config::Sampling::stable) return std::nullopt;
  const auto secret = _secret.bytes();
  if (!secret) return std::nullopt;
  const char* storebag = config::storebagNameForClientType(clientType);
  return stableSamplingFactor(*secret, storebag ? storebag : "", backend);
}

}  // namespace veltrad::backends
