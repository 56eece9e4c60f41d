// Where the environment and the storebag server come from.
#include "config/process_settings.h"

#include <gtest/gtest.h>

#include <thread>

#include "configuration.h"

namespace veltrad {
namespace {

struct Machine : Configuration {
  Machine(bool internal, const char* key, const std::optional<Value>& preference) {
    preferences.remove("environmentType");
    preferences.remove("veltra_storebag_url");
    if (preference) preferences.set(key, *preference);
    if (internal) properties.set("ReleaseType", "Internal");
  }
};

TEST(ProcessSettings, EnvironmentComesFromThePreferenceOrTheBuild) {
  const struct {
    std::optional<Value> preference;
    bool internal;
    std::uint32_t environment;
    std::string invalid;  // as logged
  } table[] = {
      {std::nullopt, true, 2, ""}, {std::nullopt, false, 3, ""},
      {0, false, 0, ""},           {1, true, 1, ""},
      {4.9, true, 4, ""},          {true, false, 1, ""},
      {5, false, 2, "5"},          {-1, false, 2, "4294967295"},
      {"4", false, 3, ""},  // a text is no number, so as if it were absent
  };
  for (const auto& c : table) {
    Lines lines{"6 userDefaultsEnvironment: Environment type " + std::to_string(c.environment)};
    if (!c.invalid.empty())
      lines.push_back("3 userDefaultsEnvironment: Invalid environment type " + c.invalid);
    const ExpectedLog log(lines);
    Machine machine(c.internal, "environmentType", c.preference);
    std::vector<std::thread> first;
    for (int i = 0; i < 4; ++i)
      first.emplace_back([&] { EXPECT_EQ(machine.settings.currentEnvironment(), c.environment); });
    for (std::thread& thread : first) thread.join();
    machine.preferences.set("environmentType", 3);
    EXPECT_EQ(machine.settings.currentEnvironment(), c.environment);
    EXPECT_EQ(log.count(platform::LogLevel::info, "userDefaultsEnvironment: "), 1);
  }
}

TEST(ProcessSettings, StorebagServerComesFromThePreferenceOrTheDeployment) {
  const std::string path = platform::Root("/").deploymentPath();
  const std::string hosts = writeXMLPropertyList(
      Dictionary{{"internalStorebagHost", "in.test:8443"}, {"publicStorebagHost", "out.test"}});
  const std::string badHost = writeXMLPropertyList(Dictionary{{"publicStorebagHost", "out.test/elsewhere"}});
  const std::string publicURL = "https://storebags.example/bags/maple",
                    builtIn = "; using the built-in hosts";
  const std::string notHost =
      ": publicStorebagHost is \"out.test/elsewhere\", expected a host name; using storebags.example";
  const std::string array = writeXMLPropertyList(Array{}), unreadable = "(unreadable)";
  const struct {
    std::optional<Value> preference;
    std::optional<std::string> deployment;
    bool internal;
    std::string url;
    std::string warning;
  } table[] = {
      {std::nullopt, std::nullopt, true, "https://storebags.internal.example/storebags/maple", ""},
      {std::nullopt, std::nullopt, false, publicURL, ""},
      {std::nullopt, hosts, true, "https://in.test:8443/storebags/maple", ""},
      {Array{}, hosts, false, "https://out.test/bags/maple", ""},
      {"https://lab.test/x", unreadable, true, "https://lab.test/x", ""},
      {std::nullopt, unreadable, false, publicURL, ": Permission denied" + builtIn},
      {std::nullopt, array, false, publicURL, ": not a dictionary" + builtIn},
      {std::nullopt, badHost, false, publicURL, notHost},
  };
  for (const auto& c : table) {
    const ExpectedLog log(c.warning.empty() ? Lines() : Lines{"4 storebagServerURL: " + path + c.warning});
    Machine machine(c.internal, "veltra_storebag_url", c.preference);
    if (c.deployment) machine.files.put(path, *c.deployment);
    if (c.deployment == unreadable) machine.files.failReads(path, FakeFileStore::Kind::noAccess);
    EXPECT_EQ(machine.settings.storebagServerURL(), c.url);
    machine.preferences.set("veltra_storebag_url", "https://later.test");
    EXPECT_EQ(machine.settings.storebagServerURL(), c.url);
  }
}

}  // namespace
}  // namespace veltrad
