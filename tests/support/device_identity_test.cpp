// The keys that the device property service is asked for, and what becomes of its answers.
#include "support/device_identity.h"

#include <gtest/gtest.h>

#include <cstring>
#include <thread>
#include <vector>

#include "fakes/fake_device_properties.h"

namespace veltrad {
namespace {

TEST(DeviceIdentity, AsksTheServiceAnewUnderItsKeys) {
  const std::vector<std::pair<const char*, std::optional<std::string> (DeviceIdentity::*)()>> operations = {
      {"ProductVersion", &DeviceIdentity::deviceProductVersion},
      {"BuildVersion", &DeviceIdentity::deviceBuildVersion},
      {"ProductType", &DeviceIdentity::deviceProductType},
      {"DeviceName", &DeviceIdentity::deviceName},
      {"HWModelStr", &DeviceIdentity::deviceHardwareModel},
      {"SerialNumber", &DeviceIdentity::deviceSerialNumber}};
  fakes::FakeDeviceProperties service;
  service.clear();
  DeviceIdentity device(service);
  for (const auto& [key, operation] : operations) {
    EXPECT_EQ((device.*operation)(), std::nullopt) << key;
    service.set(key, "first");
    EXPECT_EQ((device.*operation)(), "first") << key;
    service.set(key, "second");
    EXPECT_EQ((device.*operation)(), "second") << key;
  }
}

TEST(DeviceIdentity, CopiesAUniqueIdOnlyWhereItFits) {
  const std::string fits(40, 'a');
  fakes::FakeDeviceProperties service;
  service.clear();
  DeviceIdentity device(service);
  for (const std::optional<std::string>& id :
       {std::optional<std::string>(), std::optional(fits), std::optional(std::string(41, 'a'))}) {
    service.clear();
    if (id) service.set("UniqueDeviceID", *id);
    char buffer[41];
    std::memset(buffer, 'z', sizeof buffer);
    device.copyUniqueDeviceID(buffer, sizeof buffer);
    const std::string kept(41, 'z');
    EXPECT_EQ(std::string(buffer, sizeof buffer), id == fits ? fits + '\0' : kept);
  }
  service.set("UniqueDeviceID", "short");
  char buffer[41];
  std::memset(buffer, 'z', sizeof buffer);
  device.copyUniqueDeviceID(buffer, sizeof buffer);
  EXPECT_STREQ(buffer, "short");
  EXPECT_EQ(buffer[40], '\0');
}

TEST(DeviceIdentity, IsInternalOnlyByTheExactWord) {
  const std::vector<std::pair<std::optional<std::string>, bool>> table = {
      {std::nullopt, false}, {"Internal", true}, {"internal", false}, {"Internal ", false}, {"", false}};
  for (const auto& [releaseType, internal] : table) {
    fakes::FakeDeviceProperties service;
    service.clear();
    if (releaseType) service.set("ReleaseType", *releaseType);
    EXPECT_EQ(DeviceIdentity(service).isInternalBuild(), internal) << releaseType.value_or("(absent)");
  }
}

TEST(DeviceIdentity, DecidesOnInternalOnce) {
  fakes::FakeDeviceProperties service;
  service.clear();
  service.set("ReleaseType", "Internal");
  DeviceIdentity device(service);
  std::vector<std::thread> first;
  for (int i = 0; i < 4; ++i) first.emplace_back([&] { EXPECT_TRUE(device.isInternalBuild()); });
  for (std::thread& thread : first) thread.join();
  service.clear();
  EXPECT_TRUE(device.isInternalBuild());
}

}  // namespace
}  // namespace veltrad
