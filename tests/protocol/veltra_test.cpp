// The client library's facts and the error object.
#include "protocol/veltra.h"

#include <gtest/gtest.h>

#include "base/property_list.h"
#include "fakes/fake_file_store.h"
#include "fakes/fake_preferences.h"
#include "fakes/recorded_log.h"
#include "platform/root.h"
#include "protocol/constants.h"
#include "protocol/error.h"

namespace veltrad {
namespace {

class VeltraTest : public ::testing::Test {
 protected:
  RecordedLog _log;
  FakeFileStore _files;
  FakePreferences _preferences;
  Veltra _veltra{_files, _preferences, platform::Root("/r")};
};

TEST_F(VeltraTest, StatesThePackageVersion) {
  const std::string path = "/r/usr/share/veltra/package.plist";
  EXPECT_EQ(_veltra.packageVersion(), "8.0");
  const std::pair<Value, const char*> cases[] = {{Dictionary{{"version", "8.2.1"}}, "8.2.1"},
                                                 {Dictionary{{"version", ""}}, "8.0"},
                                                 {Dictionary{{"version", 9}}, "8.0"},
                                                 {Dictionary{}, "8.0"},
                                                 {Array{"9"}, "8.0"}};
  for (const auto& [manifest, version] : cases) {
    _files.put(path, writeXMLPropertyList(manifest));
    EXPECT_EQ(_veltra.packageVersion(), version);
  }
  _files.put(path, "rubbish");
  _log.expectLine(platform::LogLevel::warning, "The package manifest states no version: " + path);
  EXPECT_EQ(_veltra.packageVersion(), "8.0");
}

TEST_F(VeltraTest, ReadsThePublicKeyAfresh) {
  EXPECT_FALSE(_veltra.publicKeyDER());
  _files.put("/r/usr/share/veltra/publicKey.der", std::string_view("\x30\0\x01", 3));
  EXPECT_EQ(_veltra.publicKeyDER(), std::string("\x30\0\x01", 3));
}

TEST_F(VeltraTest, KeepsOneIdentifierForEachAnswerToConsent) {
  const std::string respected = _veltra.getPersistentIdentifierForDNU(true);
  const std::string overridden = _veltra.getPersistentIdentifierForDNU(false);
  EXPECT_EQ(respected.size(), 36u);
  EXPECT_NE(respected, overridden);
  EXPECT_EQ(_preferences.text("com.florn.veltra", "uuidRespectDNU"), respected);
  EXPECT_EQ(_preferences.text("com.florn.veltra", "uuidOverrideDNU"), overridden);
  EXPECT_EQ(Veltra(_files, _preferences, platform::Root("/r")).getPersistentIdentifierForDNU(true),
            respected);
}

TEST(ReportingError, TravelsAsADictionaryOfThree) {
  const Dictionary wire = dictionaryOfError(makeReportingError("refused", 503));
  EXPECT_EQ(wire,
            (Dictionary{{"domain", "com.florn.veltra.error"}, {"code", 503}, {"description", "refused"}}));
}

}  // namespace
}  // namespace veltrad
