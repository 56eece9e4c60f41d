// Where the environment and the storebag server come from.
#include "config/process_settings.h"

#include <gtest/gtest.h>

#include <thread>

#include "base/property_list.h"
#include "fakes/fake_device_properties.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_preferences.h"
#include "log_lines.h"
#include "support/device_identity.h"

namespace veltrad {
namespace {

constexpr const char* kDeployment = "/etc/veltrad/deployment.plist";

struct Machine {
  explicit Machine(bool internal) {
    if (internal) properties.set("ReleaseType", "Internal");
  }
  fakes::FakeDeviceProperties properties;
  DeviceIdentity device{properties};
  fakes::FakePreferences preferences;
  fakes::FakeFileStore files;
  ProcessSettings settings{preferences, device, files, kDeployment};
};

TEST(ProcessSettings, EnvironmentComesFromThePreferenceOrTheBuild) {
  struct Case {
    std::optional<Value> preference;
    bool internal;
    std::uint32_t environment;
    std::string invalid;  // as logged
  };
  const std::vector<Case> table = {
      {std::nullopt, true, 2, ""},   {std::nullopt, false, 3, ""}, {Value(0), false, 0, ""},
      {Value(1), true, 1, ""},       {Value(4), true, 4, ""},      {Value(4.9), true, 4, ""},
      {Value(true), false, 1, ""},   {Value(5), false, 2, "5"},    {Value(-1), false, 2, "4294967295"},
      {Value("4"), false, 3, ""},  // a text is no number, so as if it were absent
      {Value(Array{}), true, 2, ""},
  };
  LogLines log;
  for (const Case& c : table) {
    Machine machine(c.internal);
    if (c.preference) machine.preferences.set("environmentType", *c.preference);
    EXPECT_EQ(machine.settings.currentEnvironment(), c.environment);
    Lines expected;
    if (!c.invalid.empty())
      expected.push_back("error: userDefaultsEnvironment: Invalid environment type " + c.invalid);
    expected.push_back("info: userDefaultsEnvironment: Environment type " + std::to_string(c.environment));
    EXPECT_EQ(log.take(), expected);
  }
}

TEST(ProcessSettings, StorebagServerComesFromThePreferenceOrTheDeployment) {
  const std::string hosts = writeXMLPropertyList(
      Dictionary{{"internalStorebagHost", "in.test:8443"}, {"publicStorebagHost", "out.test"}});
  const std::string badHost = writeXMLPropertyList(Dictionary{{"publicStorebagHost", "out.test/elsewhere"}});
  struct Case {
    std::optional<Value> preference;
    std::optional<std::optional<std::string>> deployment;  // absent; there but unreadable; its content
    bool internal;
    std::string url;
    Lines lines;
  };
  const std::string path = kDeployment;
  const std::vector<Case> table = {
      {std::nullopt, std::nullopt, true, "https://storebags.internal.example/storebags/maple", {}},
      {std::nullopt, std::nullopt, false, "https://storebags.example/bags/maple", {}},
      {std::nullopt, hosts, true, "https://in.test:8443/storebags/maple", {}},
      {std::nullopt, hosts, false, "https://out.test/bags/maple", {}},
      {Value("https://lab.test/x"), hosts, true, "https://lab.test/x", {}},
      {Value("https://lab.test/x"), std::optional<std::string>(), false, "https://lab.test/x", {}},
      {Value(Array{}), hosts, false, "https://out.test/bags/maple", {}},
      {std::nullopt,
       std::optional<std::string>(),
       false,
       "https://storebags.example/bags/maple",
       {"warning: storebagServerURL: " + path + ": Permission denied; using the built-in hosts"}},
      {std::nullopt,
       writeXMLPropertyList(Array{}),
       false,
       "https://storebags.example/bags/maple",
       {"warning: storebagServerURL: " + path + ": not a dictionary; using the built-in hosts"}},
      {std::nullopt,
       badHost,
       false,
       "https://storebags.example/bags/maple",
       {"warning: storebagServerURL: " + path +
        ": publicStorebagHost is \"out.test/elsewhere\", expected a host name; using storebags.example"}},
  };
  LogLines log;
  for (const Case& c : table) {
    Machine machine(c.internal);
    if (c.preference) machine.preferences.set("veltra_storebag_url", *c.preference);
    if (c.deployment && *c.deployment) machine.files.put(kDeployment, **c.deployment);
    if (c.deployment && !*c.deployment)
      machine.files.failReads(kDeployment, fakes::FakeFileStore::Kind::noAccess);
    EXPECT_EQ(machine.settings.storebagServerURL(), c.url);
    EXPECT_EQ(log.take(), c.lines);
  }
}

TEST(ProcessSettings, StayWhatTheyWereAtFirstUse) {
  LogLines log;
  Machine machine(true);
  machine.preferences.set("environmentType", 4);
  machine.preferences.set("veltra_storebag_url", "https://lab.test");
  std::vector<std::thread> first;
  for (int i = 0; i < 4; ++i)
    first.emplace_back([&] {
      EXPECT_EQ(machine.settings.currentEnvironment(), 4u);
      EXPECT_EQ(machine.settings.storebagServerURL(), "https://lab.test");
    });
  for (std::thread& thread : first) thread.join();
  machine.preferences.remove("environmentType");
  machine.preferences.remove("veltra_storebag_url");
  EXPECT_EQ(machine.settings.currentEnvironment(), 4u);
  EXPECT_EQ(machine.settings.storebagServerURL(), "https://lab.test");
  EXPECT_EQ(log.take(), Lines{"info: userDefaultsEnvironment: Environment type 4"});
}

}  // namespace
}  // namespace veltrad
