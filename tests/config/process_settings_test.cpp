// SPDX-License-Identifier: Apache-2.0
// The address of the storebag server, and settings that are unknown during a shortage.
#include "config/process_settings.h"

#include <gtest/gtest.h>

#include <functional>

#include "configuration.h"
#include "formats/property_list.h"

namespace veltrad {
namespace {

struct Machine : Configuration {
  Machine(bool internal, const std::optional<Value>& preference) {
    preferences.clear();
    if (preference) preferences.set("veltra_storebag_url", *preference);
    if (internal) properties.set("ReleaseType", "Internal");
  }
};

TEST(ProcessSettings, StorebagServerComesFromThePreferenceOrTheDeployment) {
  const std::string path = platform::Root("/").deploymentPath();
  const auto hosts = [](const char* outside) {
    return formats::writeXMLPropertyList(
        Dictionary{{"internalStorebagHost", "in.test:8443"}, {"publicStorebagHost", outside}});
  };
  const std::string publicURL = "https://storebags.example/bags/maple", unreadable = "(unreadable)";
  const struct {
    std::optional<Value> preference;
    std::string deployment;
    bool internal;
    std::string url, warning;
  } table[] = {{{}, "", true, "https://storebags.internal.example/storebags/maple", ""},
               {{}, "", false, publicURL, ""},
               {{}, hosts("out.test"), true, "https://in.test:8443/storebags/maple", ""},
               {Array{}, hosts("out.test"), false, "https://out.test/bags/maple", ""},
               {"https://lab.test/x", unreadable, true, "https://lab.test/x", ""},
               {{}, unreadable, false, publicURL, ": Permission denied; using the built-in hosts"},
               {{},
                formats::writeXMLPropertyList(Array{}),
                false,
                publicURL,
                ":1:1: not a dictionary; using the built-in hosts"},
               {{},
                hosts("a/b"),
                false,
                publicURL,
                ":6:2: publicStorebagHost is \"a/b\", expected a host name; using storebags.example"}};
  for (const auto& c : table) {
    const ExpectedLog log(c.warning.empty() ? Lines() : Lines{"4 storebagServerURL: " + path + c.warning});
    Machine machine(c.internal, c.preference);
    if (!c.deployment.empty()) machine.files.put(path, c.deployment);
    if (c.deployment == unreadable) machine.files.failReads(path, FakeFileStore::Kind::noAccess);
    EXPECT_EQ(machine.settings.storebagServerURL(), c.url);
    machine.preferences.set("veltra_storebag_url", "https://later.test");
    EXPECT_EQ(machine.settings.storebagServerURL(), c.url);
  }
}

TEST(ProcessSettings, AreNothingDuringAShortageAndRightAfterIt) {
  const std::string path = platform::Root("/").deploymentPath();
  const ExpectedLog log({});
  Machine machine(true, {});
  machine.files.put(path, formats::writeXMLPropertyList(Dictionary{{"internalStorebagHost", "in.test"}}));
  const std::function<void(bool)> shortages[] = {[&](bool on) { machine.preferences.runShort(on); },
                                                 [&](bool on) { machine.properties.runShort(on); },
                                                 [&](bool on) { machine.files.runShort(on); }};
  for (const auto& runShort : shortages) {
    support::DeviceIdentity device(machine.properties);
    config::ProcessSettings fresh(machine.preferences, device, machine.files, path);
    runShort(true);
    EXPECT_EQ(fresh.storebagServerURL(), std::nullopt);
    const auto environment = fresh.currentEnvironment();
    EXPECT_TRUE(!environment || *environment == 2);
    runShort(false);
    EXPECT_EQ(fresh.currentEnvironment(), 2u);
    EXPECT_EQ(fresh.storebagServerURL(), "https://in.test/storebags/maple");
    runShort(true);
    EXPECT_EQ(fresh.currentEnvironment(), 2u);
    EXPECT_EQ(fresh.storebagServerURL(), "https://in.test/storebags/maple");
    runShort(false);
  }
}

}  // namespace
}  // namespace veltrad
