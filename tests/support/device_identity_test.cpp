// SPDX-License-Identifier: Apache-2.0
// The use of the device property service's answers.
#include "support/device_identity.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "fakes/machine.h"

namespace veltrad {
namespace {

TEST(DeviceIdentity, CopiesAUniqueIdOnlyWhereItFits) {
  FakeDeviceProperties service;
  support::DeviceIdentity device(service);
  const std::string before(41, 'z');
  for (const std::size_t length : {1u, 40u, 41u, 100u}) {
    const std::string id(length, 'a');
    std::string buffer = before;
    service.set("UniqueDeviceID", id);
    device.copyUniqueDeviceID(buffer.data(), buffer.size());
    EXPECT_TRUE(length < 41 ? buffer.c_str() == id && buffer[40] == '\0' : buffer == before) << length;
  }
}

TEST(DeviceIdentity, IsInternalByTheExactWordOnce) {
  for (const std::string releaseType : {"Internal", "internal", "Internal ", ""}) {
    FakeDeviceProperties service;
    service.set("ReleaseType", releaseType);
    support::DeviceIdentity device(service);
    const bool internal = releaseType == "Internal";
    std::vector<std::thread> first;
    for (int i = 0; i < 4; ++i) first.emplace_back([&] { EXPECT_EQ(device.isInternalBuild(), internal); });
    for (std::thread& thread : first) thread.join();
    service.set("ReleaseType", internal ? "" : "Internal");
    EXPECT_EQ(device.isInternalBuild(), internal);
  }
}

}  // namespace
}  // namespace veltrad
