// SPDX-License-Identifier: Apache-2.0
// Stable sampling factors, and which back ends get one.
#include "backends/sampling_factors.h"

#include <gtest/gtest.h>

#include <array>

#include "config/operator_settings.h"
#include "fakes/recorded_log.h"
#include "fakes/world.h"
#include "platform/device_secret.h"

namespace veltrad {
namespace {

// The expected number was computed with another implementation of HMAC.
TEST(SamplingFactors, AreADigestThatIsSpreadEvenlyOverDevices) {
  std::string secret;
  for (char c = 0; c < 32; ++c) secret.push_back(c);
  EXPECT_DOUBLE_EQ(backends::stableSamplingFactor(secret, "quindle", "httppost"), 0.736504215578954);
  EXPECT_NE(backends::stableSamplingFactor(secret, "quindle", "httppost2"),
            backends::stableSamplingFactor(secret, "quindleh", "ttppost2"));
  std::array<int, 10> tenths{};
  for (int device = 0; device < 10'000; ++device) {
    const double factor = backends::stableSamplingFactor(std::to_string(device), "quindle", "httppost");
    ++tenths.at(static_cast<std::size_t>(factor * 10));
  }
  for (const int count : tenths) EXPECT_NEAR(count, 1'000, 150);  // five standard deviations
}

TEST(SamplingFactors, AreDrawnUnlessChosenOtherwiseAndTheSecretIsThere) {
  RecordedLog log;
  World world;
  config::OperatorSettings settings(world.files, world.root.settingsPath());
  const std::string path = world.root.secretPath();
  backends::BackendServices services = world.services;
  platform::DeviceSecret secret(world.files, path);
  backends::SamplingFactors factors(settings, secret);
  services.sampling = &factors;
  backends::BackendFactory factory(services);
  auto facts = std::make_shared<backends::SessionFacts>();
  facts->compType = 7;
  const auto factor = [&] {
    return factory.newBackendWithName("ampery", nullptr, "Elm", facts, false)->samplingFactor();
  };
  EXPECT_EQ(factor(), world.random.draw);
  EXPECT_FALSE(world.files.bytes(path));
  world.files.put(world.root.settingsPath(), R"({"sampling": "stable"})");
  settings.readAgain();
  world.files.runShort(true);
  EXPECT_EQ(factor(), world.random.draw);  // and nothing is remembered
  world.files.runShort(false);
  const double stable = factor();
  EXPECT_EQ(stable, backends::stableSamplingFactor(world.files.bytes(path).value(), "quindle", "ampery"));
  EXPECT_EQ(world.files.mode(path), 0600u);
  world.files.runShort(true, true);
  EXPECT_EQ(factor(), stable);
  world.files.runShort(false);
  // A disk that takes nothing: one warning, and one secret for as long as the process lasts.
  world.files.remove(path);
  world.files.failWrites(FakeFileStore::Kind::noSpace);
  log.expectLine(platform::LogLevel::warning,
                 "The secret of this device cannot be kept, another one serves until the daemon ends: " +
                     path + ": No space left on device");
  platform::DeviceSecret lasting(world.files, path);
  EXPECT_EQ(lasting.bytes(), lasting.bytes());
  EXPECT_EQ(lasting.bytes()->size(), platform::DeviceSecret::kBytes);
}

}  // namespace
}  // namespace veltrad
