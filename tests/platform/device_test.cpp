// What the device and the locale say of themselves.
#include <gmock/gmock.h>
#include <time.h>

#include <cstdlib>

#include "base/property_list.h"
#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "platform/device_properties.h"
#include "platform/locale.h"

namespace veltrad::platform {
namespace {

using Text = std::optional<std::string>;
constexpr const char* kList = "/root/etc/veltrad/device.plist";

class MachinePropertiesTest : public ::testing::Test {
 protected:
  void put(const Dictionary& list) { _files.put(kList, writeXMLPropertyList(list)); }

  Text value(std::string_view key) { return _properties.value(key).value(); }

  RecordedLog _log;
  FakeFileStore _files;
  MachineProperties _properties{_files, kList};
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

TEST_F(MachinePropertiesTest, AsksDMIThenTheDeviceTree) {
  for (const char* key : {"ProductVersion", "ProductType", "UniqueDeviceID", "ReleaseType", "unheard of"})
    EXPECT_EQ(value(key), Text()) << key;
  _files.put("/usr/lib/os-release", "VERSION_ID=13\n");
  _files.put("/proc/sys/kernel/osrelease", "6.1.0-18\n");
  _files.put("/proc/device-tree/model", std::string_view("Board Model B\0", 14));
  EXPECT_EQ(value("ProductVersion"), "13");
  EXPECT_EQ(value("BuildVersion"), "6.1.0-18");
  EXPECT_EQ(value("ProductType"), "Board Model B");
  EXPECT_EQ(value("DeviceName"), "Embedded");
  _files.put("/sys/class/dmi/id/product_name", "Workbench 3 \n");
  _files.put("/sys/class/dmi/id/board_name", "WB3-B\n");
  _files.put("/sys/class/dmi/id/product_serial", " \n");
  _files.put("/sys/class/dmi/id/chassis_type", "10\n");
  EXPECT_EQ(value("ProductType"), "Workbench 3");
  EXPECT_EQ(value("HWModelStr"), "WB3-B");
  EXPECT_EQ(value("SerialNumber"), Text());
  EXPECT_EQ(value("DeviceName"), "Laptop");
}

TEST_F(MachinePropertiesTest, NamesTheClassOfTheDevice) {
  const std::tuple<const char*, const char*, const char*> cases[] = {
      {"/sys/class/dmi/id/chassis_type", "3\n", "Desktop"},
      {"/proc/cpuinfo", "processor : 0\nflags\t\t: fpu hypervisor\nbugs\t:\n", "VM"},
      {"/proc/cpuinfo", "processor : 0\nflags\t\t: fpu\nbugs\t: hypervisor\n", "Desktop"},
      {"/sys/class/dmi/id/sys_vendor", "QEMU\n", "VM"},
      {"/run/systemd/container", "", "Container"},
      {"/etc/machine-info", "CHASSIS=tablet\n", "Tablet"}};
  for (const auto& [file, bytes, name] : cases) {
    _files.put(file, bytes);
    EXPECT_EQ(value("DeviceName"), name);
  }
}

TEST_F(MachinePropertiesTest, TheDeviceIDIsFortyDigitsThatOnlyTheMachineIDChanges) {
  const std::string id = "3d1219c7c4c5404aaa1f6d2a48adfda4";
  _files.put("/etc/machine-id", id + "\n");
  const auto device = value("UniqueDeviceID");
  EXPECT_THAT(device.value_or(""), ::testing::MatchesRegex("[0-9a-f]{40}"));
  // Not what any other program makes of it that takes the bare SHA-256.
  EXPECT_NE(device, "0035969ec53f6e7f0fb40f08cc9ed4783aa99c20");
  _files.put("/etc/machine-id", "4d1219c7c4c5404aaa1f6d2a48adfda4\n");
  EXPECT_NE(value("UniqueDeviceID"), device);
  _files.put("/etc/machine-id", "uninitialized\n");
  EXPECT_EQ(value("UniqueDeviceID"), Text());
}

// Neither the machine nor a default is asked instead: it may say something else.
TEST_F(MachinePropertiesTest, DuringAShortageWhatWasLastReadServesOrNothing) {
  put({{"SerialNumber", "S1"}});
  _files.put("/usr/lib/os-release", "VERSION_ID=13\n");
  _files.put("/etc/os-release", "VERSION_ID=12\n");
  for (const char* key : {"SerialNumber", "ProductVersion", "DeviceName"}) {
    for (const char* path : {kList, "/etc/os-release", "/proc/cpuinfo"})
      _files.failReads(path, FileFailure::Kind::shortage);
    EXPECT_FALSE(_properties.value(key)) << key;
    _files.failReads(kList, {});
    EXPECT_EQ(_properties.value(key).ok(), key == std::string("SerialNumber")) << key;
    for (const char* path : {"/etc/os-release", "/proc/cpuinfo"}) _files.failReads(path, {});
  }
  MachineProperties properties{_files, kList};
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

TEST(Locale, FindsTheCountryInALocaleName) {
  std::string countries;
  for (const char* name : {"de_DE.UTF-8", "de_DE", "de_DE@euro", "es_419", "en_gb", "ca_ES.UTF-8@valencia"})
    countries += countryOfLocaleName(name).value_or("-") + " ";
  EXPECT_EQ(countries, "DE DE DE 419 GB ES ");
  for (const char* name : {"C", "POSIX", "C.UTF-8", "eo", "eo.UTF-8", "_DE", "de_", "de_DEU", "de_D1",
                           "C.x_DE", "", "de_\xc3\x9c"})
    EXPECT_EQ(countryOfLocaleName(name), Text()) << name;
}

class EnvironmentLocaleTest : public ::testing::Test {
 protected:
  static void forget() {
    for (const char* variable : {"LC_ALL", "LC_MESSAGES", "LANG", "TZ"}) ::unsetenv(variable);
    ::tzset();
  }
  void SetUp() override { forget(); }
  void TearDown() override { forget(); }
  FakeFileStore _files;
  EnvironmentLocale _locale{_files, "/root/etc/locale.conf"};
};

TEST_F(EnvironmentLocaleTest, TakesTheFirstVariableThatIsSetAndNotEmpty) {
  EXPECT_EQ(_locale.countryCode(), Text());
  _files.put("/root/etc/locale.conf", "# comment\nLANG=\"fr_CA.UTF-8\"\nLC_TIME=de_DE.UTF-8\n");
  const std::tuple<const char*, const char*, Text> cases[] = {
      {"LC_ALL", "", "CA"},      {"LANG", "pt_BR.UTF-8", "BR"},
      {"LC_MESSAGES", "C", {}},  // set, without one
      {"LC_ALL", "de_AT", "AT"}, {"LC_ALL", "", {}},
      {"LC_MESSAGES", "", "BR"}};
  for (const auto& [variable, value, country] : cases) {
    ::setenv(variable, value, 1);
    EXPECT_EQ(_locale.countryCode(), country) << variable << value;
  }
}

TEST_F(EnvironmentLocaleTest, SeesAChangedZone) {
  ::setenv("TZ", "IST-5:30", 1);
  EXPECT_EQ(_locale.timeZoneOffset(), 5 * 3'600 + 1'800);
  ::setenv("TZ", "YYY+8", 1);
  EXPECT_EQ(_locale.timeZoneOffset(), -8 * 3'600);
}

}  // namespace
}  // namespace veltrad::platform
