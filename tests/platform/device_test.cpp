// SPDX-License-Identifier: Apache-2.0
// The properties of the device.
#include <gmock/gmock.h>

#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "formats/property_list.h"
#include "platform/device_properties.h"

namespace veltrad::platform {
namespace {

using Text = std::optional<std::string>;
constexpr const char* kDeviceList = "/root/etc/veltrad/device.plist";

class MachinePropertiesTest : public ::testing::Test {
 protected:
  void put(const Dictionary& list) { _files.put(kDeviceList, formats::writeXMLPropertyList(list)); }

  Text value(std::string_view key) { return _properties.value(key).value(); }

  RecordedLog _log;
  FakeFileStore _files;
  platform::MachineProperties _properties{_files, kDeviceList};
};

TEST_F(MachinePropertiesTest, TheListComesFirstAndAnEmptyTextMeansNoValue) {
  _files.put("/etc/os-release", "NAME=x\nVERSION_ID=\"12\"\nBUILD_ID='2026.1'\n");
  EXPECT_EQ(value("ProductVersion"), "12");
  EXPECT_EQ(value("BuildVersion"), "2026.1");
  put({{"ProductVersion", "17.4"}, {"BuildVersion", ""}, {"ReleaseType", "Internal"}, {"DeviceName", 5}});
  EXPECT_EQ(value("ProductVersion"), "17.4");
  EXPECT_EQ(value("BuildVersion"), Text());
  EXPECT_EQ(value("ReleaseType"), "Internal");
  EXPECT_EQ(value("DeviceName"), "Computer");  // no text: as if the key were absent
  put({{"BuildVersion", "B"}});
  EXPECT_EQ(value("BuildVersion"), "B");
  EXPECT_EQ(value("ReleaseType"), Text());
}

// Neither the machine nor a default is asked instead: it may say something else.
TEST_F(MachinePropertiesTest, DuringAShortageWhatWasLastReadServesOrNothing) {
  put({{"SerialNumber", "S1"}});
  _files.put("/usr/lib/os-release", "VERSION_ID=13\n");
  _files.put("/etc/os-release", "VERSION_ID=12\n");
  for (const char* key : {"SerialNumber", "ProductVersion", "DeviceName"}) {
    for (const char* path : {kDeviceList, "/etc/os-release", "/proc/cpuinfo"})
      _files.failReads(path, platform::FileFailure::Kind::shortage);
    EXPECT_FALSE(_properties.value(key)) << key;
    _files.failReads(kDeviceList, {});
    EXPECT_EQ(_properties.value(key).ok(), key == std::string("SerialNumber")) << key;
    for (const char* path : {"/etc/os-release", "/proc/cpuinfo"}) _files.failReads(path, {});
  }
  platform::MachineProperties properties{_files, kDeviceList};
  const auto all = [&] {
    std::string texts;
    for (const char* key : {"SerialNumber", "ProductVersion", "DeviceName", "BuildVersion"})
      texts += properties.value(key).ok() ? properties.value(key).value().value_or("-") + " " : "? ";
    return texts;
  };
  _files.runShort(true, true);
  EXPECT_EQ(all(), "? ? ? ? ");
  _files.runShort(false);
  EXPECT_EQ(all(), "S1 12 Computer - ");
  _files.runShort(true, true);
  EXPECT_EQ(all(), "S1 12 Computer - ");
}

}  // namespace
}  // namespace veltrad::platform
