// SPDX-License-Identifier: Apache-2.0
// Uses the daemon's UnseededSequence, stableSamplingFactor, decideOnClient and EventBatch.
#include "sampling.h"

#include <string>

#include "backends/backend.h"
#include "backends/https/client_decision.h"
#include "backends/https/event_batch.h"
#include "backends/sampling_factors.h"
#include "platform/device_secret.h"
#include "platform/random.h"
#include "wire/constants.h"

namespace veltrad::simulate {

Sampling::Sampling(World& world) : _world(world) {
  constexpr std::size_t kDraws = 1u << 16;  // as many as a device counts
  platform::UnseededSequence sequence;
  _drawn.reserve(kDraws);
  for (std::size_t i = 0; i < kDraws; ++i) _drawn.push_back(sequence.uniform());
}

double Sampling::nextFactor(std::uint32_t index) {
  Device& device = _world.devices[index];
  device.draws = static_cast<std::uint16_t>(device.draws + 2);
  if (_world.scenario.settings.sampling == config::Sampling::stable) return stableFactor(index);
  return _drawn[static_cast<std::uint16_t>(device.draws - 1)];
}

double Sampling::stableFactor(std::uint32_t index) {
  Device& device = _world.devices[index];
  if (device.stableFactor >= 0) return device.stableFactor;
  Dice ofDevice(_world.scenario.seed << 32 ^ index);
  std::string secret;
  while (secret.size() < platform::DeviceSecret::kBytes) {
    const std::uint64_t bits = ofDevice.bits();
    for (int shift = 0; shift < 64; shift += 8) secret += static_cast<char>(bits >> shift & 0xff);
  }
  device.stableFactor = backends::stableSamplingFactor(secret, "quindle", wire::kVeltraBackendHTTPPost);
  return device.stableFactor;
}

bool Sampling::reports(const Device& device, double factor) const {
  const backends::ClientFacts facts{true, "US", "Elm", "E42", factor};
  return backends::decideOnClient(_world.bagOf(device).entry, facts).state == backends::kBackendReporting;
}

bool Sampling::isFull(const Device& device) const {
  return backends::EventBatch::isReached(device.held, _world.bagOf(device).entry.eventThreshold);
}

}  // namespace veltrad::simulate
