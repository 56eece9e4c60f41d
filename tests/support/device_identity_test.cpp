// The keys that the device property service is asked for, and what becomes of its answers.
#include "support/device_identity.h"

#include <gtest/gtest.h>

#include <thread>
#include <utility>
#include <vector>

#include "fakes/fake_device_properties.h"

namespace veltrad {
namespace {

TEST(DeviceIdentity, AsksTheServiceAnewUnderItsKeys) {
  const std::pair<const char*, std::optional<std::string> (DeviceIdentity::*)()> operations[] = {
      {"ProductVersion", &DeviceIdentity::deviceProductVersion},
      {"BuildVersion", &DeviceIdentity::deviceBuildVersion},
      {"ProductType", &DeviceIdentity::deviceProductType},
      {"DeviceName", &DeviceIdentity::deviceName},
      {"HWModelStr", &DeviceIdentity::deviceHardwareModel},
      {"SerialNumber", &DeviceIdentity::deviceSerialNumber}};
  FakeDeviceProperties service;
  service.clear();
  DeviceIdentity device(service);
  for (const auto& [key, operation] : operations) {
    EXPECT_EQ((device.*operation)(), std::nullopt) << key;
    for (const char* value : {"first", "second"}) {
      service.set(key, value);
      EXPECT_EQ((device.*operation)(), value) << key;
    }
  }
}

TEST(DeviceIdentity, CopiesAUniqueIdOnlyWhereItFits) {
  FakeDeviceProperties service;
  DeviceIdentity device(service);
  const std::string before(41, 'z');
  for (const std::size_t length : {1u, 40u, 41u, 100u}) {
    const std::string id(length, 'a');
    std::string buffer = before;
    service.remove("UniqueDeviceID");
    device.copyUniqueDeviceID(buffer.data(), buffer.size());
    EXPECT_EQ(buffer, before);
    service.set("UniqueDeviceID", id);
    device.copyUniqueDeviceID(buffer.data(), buffer.size());
    EXPECT_TRUE(length < 41 ? buffer.c_str() == id && buffer[40] == '\0' : buffer == before) << length;
  }
}

TEST(DeviceIdentity, IsInternalByTheExactWordOnce) {
  const char* const absent = nullptr;
  for (const char* releaseType : {"Internal", "internal", "Internal ", "", absent}) {
    FakeDeviceProperties service;
    if (releaseType) service.set("ReleaseType", releaseType);
    DeviceIdentity device(service);
    const bool internal = releaseType && std::string(releaseType) == "Internal";
    std::vector<std::thread> first;
    for (int i = 0; i < 4; ++i) first.emplace_back([&] { EXPECT_EQ(device.isInternalBuild(), internal); });
    for (std::thread& thread : first) thread.join();
    service.set("ReleaseType", internal ? "" : "Internal");
    EXPECT_EQ(device.isInternalBuild(), internal);
  }
}

}  // namespace
}  // namespace veltrad
