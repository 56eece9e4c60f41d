// SPDX-License-Identifier: Apache-2.0
// Preference domains over real files and over a disk with faults.
#include "platform/preferences.h"

#include <gtest/gtest.h>

#include "base/property_list.h"
#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "fakes/scarce_memory.h"
#include "platform/uuid.h"

namespace veltrad::platform {
namespace {

using Level = platform::LogLevel;
using Kind = platform::FileFailure::Kind;

constexpr std::string_view kDomain = platform::kVeltraPreferenceDomain;
constexpr const char* kPath = "/preferences/com.florn.veltra.plist";

class FilePreferencesTest : public ::testing::Test {
 protected:
  void put(const Dictionary& all) { _files.put(kPath, writeBinaryPropertyList(all)); }

  RecordedLog _log;
  FakeFileStore _files;
  platform::FilePreferences _preferences{_files, "/preferences"};
};

TEST_F(FilePreferencesTest, PutsAMalformedFileAsideWithOneLineAndGoesOn) {
  for (const std::string& bytes :
       {std::string("bplist00rubbish"), std::string(""), writeBinaryPropertyList(Array{1})}) {
    _files.put(kPath, bytes);
    _log.expectLine(Level::error, "kept as /preferences/com.florn.veltra.plist.corrupt");
    for (int i = 0; i < 2; ++i) EXPECT_FALSE(_preferences.value(kDomain, "a"));
    EXPECT_EQ(_files.bytes(std::string(kPath) + ".corrupt"), bytes);
    const auto made = _preferences.textOrStore(kDomain, "a", platform::randomUUIDText);
    EXPECT_EQ(_preferences.text(kDomain, "a"), made);
  }
}

TEST(FilePreferences, AFileForWhichThereIsNoMemoryIsNotPutAside) {
  const std::string text =
      R"(<plist version="1.0"><dict><key>consent</key><true/><key>id</key><string>a text</string></dict></plist>)";
  forEachShortage([&](const auto& shortOfMemory) {
    FakeFileStore files;
    platform::FilePreferences preferences(files, "/preferences");
    files.put(kPath, text);
    shortOfMemory([&] { static_cast<void>(preferences.lookUp(kDomain, "consent")); });
    EXPECT_EQ(preferences.value(kDomain, "consent"), Value(true));
    EXPECT_EQ(files.bytes(kPath), text);
  });
}

TEST_F(FilePreferencesTest, AFileThatCannotBeReadForTheMomentIsNotOverwritten) {
  put({{"kept", 1}});
  _files.failReads(kPath, Kind::other);
  _log.expectLine(Level::error, "Preferences could not be read, defaults serve: /preferences/");
  _log.expectLine(Level::error, "Preference not stored, its file cannot be read: /preferences/");
  EXPECT_FALSE(_preferences.value(kDomain, "kept"));
  EXPECT_TRUE(_preferences.textOrStore(kDomain, "new", platform::randomUUIDText));
  _files.failReads(kPath, {});
  EXPECT_EQ(_preferences.text(kDomain, "kept"), "1");
}

TEST_F(FilePreferencesTest, ATextThatCannotBeStoredLastsAsLongAsTheProcess) {
  put({{"empty", ""}});
  EXPECT_EQ(_preferences.textOrStore(kDomain, "empty", platform::randomUUIDText)->size(), 36u);
  _files.failWrites(Kind::noSpace);
  _log.expectLine(Level::error,
                  "Preference not stored: /preferences/com.florn.veltra.plist: No space left on device");
  const auto made = _preferences.textOrStore(kDomain, "id", platform::randomUUIDText);
  EXPECT_EQ(_preferences.textOrStore(kDomain, "id", platform::randomUUIDText), made);
  EXPECT_EQ(_preferences.text(kDomain, "id"), made);
  _files.failWrites({});
  EXPECT_NE(
      platform::FilePreferences(_files, "/preferences").textOrStore(kDomain, "id", platform::randomUUIDText),
      made);
}

// Another identifier than the stored one is never made, kept or stored.
TEST_F(FilePreferencesTest, AShortageIsNoAnswer) {
  put({{"id", "stored"}});
  for (const bool stampsFail : {false, true}) {
    platform::FilePreferences preferences(_files, "/preferences");
    _files.runShort(true, stampsFail);
    EXPECT_FALSE(preferences.lookUp(kDomain, "id"));
    EXPECT_EQ(preferences.textOrStore(kDomain, "id", platform::randomUUIDText), std::nullopt);
    _files.runShort(false);
    EXPECT_EQ(preferences.textOrStore(kDomain, "id", platform::randomUUIDText), "stored");
    _files.runShort(true, stampsFail);
    EXPECT_EQ(preferences.lookUp(kDomain, "id").ok(), !stampsFail);
    _files.runShort(false);
  }
  EXPECT_EQ(_preferences.text(kDomain, "id"), "stored");
  // The new content is unknown, and consent that may have been withdrawn does not count.
  put({{"id", "other"}});
  _files.runShort(true);
  EXPECT_EQ(_preferences.value(kDomain, "id"), std::nullopt);
  _files.runShort(false);
  EXPECT_EQ(_preferences.text(kDomain, "id"), "other");
  // Nothing is stored, and that is known: what is made now is stored as soon as it can be.
  _files.runShort(true);
  _log.expectLine(Level::error, "Preference not stored, its file cannot be read: /preferences/");
  const auto made = _preferences.textOrStore(kDomain, "new", platform::randomUUIDText);
  ASSERT_TRUE(made);
  EXPECT_EQ(_preferences.textOrStore(kDomain, "new", platform::randomUUIDText), made);
  _files.runShort(false);
  EXPECT_EQ(_preferences.textOrStore(kDomain, "new", platform::randomUUIDText), made);
  EXPECT_EQ(platform::FilePreferences(_files, "/preferences").text(kDomain, "new"), made);
}

}  // namespace
}  // namespace veltrad::platform
