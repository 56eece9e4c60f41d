// The client library's facts.
#include "protocol/veltra.h"

#include <gtest/gtest.h>

#include "base/property_list.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_preferences.h"
#include "fakes/recorded_log.h"
#include "platform/root.h"

namespace veltrad {
namespace {

TEST(Veltra, StatesThePackageVersion) {
  RecordedLog log;
  FakeFileStore files;
  FakePreferences preferences;
  Veltra veltra(files, preferences, platform::Root("/r"));
  const std::string path = "/r/usr/share/veltra/package.plist";
  EXPECT_EQ(veltra.packageVersion(), "8.0");
  const std::pair<Value, const char*> cases[] = {{Dictionary{{"version", "8.2.1"}}, "8.2.1"},
                                                 {Dictionary{{"version", ""}}, "8.0"},
                                                 {Dictionary{{"version", 9}}, "8.0"},
                                                 {Dictionary{}, "8.0"},
                                                 {Array{"9"}, "8.0"}};
  for (const auto& [manifest, version] : cases) {
    files.put(path, writeXMLPropertyList(manifest));
    EXPECT_EQ(veltra.packageVersion(), version);
  }
  files.put(path, "rubbish");
  log.expectLine(platform::LogLevel::warning, "The package manifest states no version: " + path);
  EXPECT_EQ(veltra.packageVersion(), "8.0");
}

}  // namespace
}  // namespace veltrad
