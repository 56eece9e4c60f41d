// SPDX-License-Identifier: Apache-2.0
// Bodies in pieces are reassembled, even if pieces are repeated; only old files are removed.
#include "gateway/piece_store.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <fstream>

namespace veltrad::gateway {
namespace {

namespace fs = std::filesystem;

constexpr std::int64_t kHour = 3'600'000'000'000;
// 2026-11-26 12:00:00 UTC.
constexpr std::int64_t kNoon = 1'795'694'400'000'000'000;

class Pieces : public testing::Test {
 protected:
  Pieces() {
    std::string name = (fs::temp_directory_path() / "pieces-XXXXXX").string();
    folder = ::mkdtemp(name.data());
    EXPECT_TRUE(store().open().ok());
  }
  ~Pieces() override { fs::remove_all(folder); }

  PieceStore store() const { return PieceStore(folder.string()); }
  std::string content(const std::string& path) const {
    std::ifstream file(folder / path);
    return {std::istreambuf_iterator<char>(file), {}};
  }

  fs::path folder;
};

TEST_F(Pieces, BecomeWholeAlsoIfABatchIsRepeated) {
  for (int i = 0; i < 2; ++i) {
    PieceStore pieces = store();
    ASSERT_TRUE(pieces.write("ab 3", "def", kNoon).ok() && pieces.write("ab 0", "abc", kNoon).ok());
    EXPECT_EQ(pieces.wholeOf("ab 6", "g").value(), "abcdefg");
    EXPECT_EQ(pieces.keep("ab 6", "g", "name", kNoon).value(), "2026-11-26/name");
    EXPECT_TRUE(pieces.sync().ok());
    EXPECT_EQ(content("2026-11-26/name"), "abcdefg");
    pieces.forget("ab 6");
    EXPECT_TRUE(fs::is_empty(folder / "incoming"));
  }
  EXPECT_EQ(store().wholeOf("", "all of it").value(), "all of it");
}

TEST_F(Pieces, ThatCanNeverBeWholeDoNotHoldUpTheRest) {
  PieceStore pieces = store();
  ASSERT_TRUE(pieces.write("ab 0", "abc", kNoon).ok());
  for (const char* place : {"cd 3", "ab 9", "../x 3", "ab", "ab -1", "ab 99999999999999999999"}) {
    const auto whole = pieces.wholeOf(place, "g");
    ASSERT_FALSE(whole.ok()) << place;
    EXPECT_EQ(whole.error().kind, StoreError::Kind::data) << place;
  }
  EXPECT_EQ(pieces.keep("cd 3", "g", "name", kNoon).error().kind, StoreError::Kind::data);
  // A shortage is no such thing.
  fs::remove_all(folder);
  std::ofstream(folder) << "no folder";
  EXPECT_EQ(pieces.keep("ab 3", "g", "name", kNoon).error().kind, StoreError::Kind::passing);
  EXPECT_EQ(pieces.wholeOf("ab 3", "g").error().kind, StoreError::Kind::passing);
}

TEST_F(Pieces, GoWhenTheirEndNeverCame) {
  PieceStore pieces = store();
  ASSERT_TRUE(pieces.write("ab 0", "abc", kNoon).ok() && pieces.write("cd 0", "abc", kNoon + 2 * kHour).ok());
  ASSERT_TRUE(store().open().ok());
  // By the times of messages, because the drain may have rested for days.
  pieces.forgetUnfinished(kNoon + 24 * kHour);
  EXPECT_TRUE(fs::exists(folder / "incoming/ab"));
  pieces.forgetUnfinished(kNoon + 25 * kHour);
  EXPECT_FALSE(fs::exists(folder / "incoming/ab"));
  EXPECT_TRUE(fs::exists(folder / "incoming/cd"));
}

TEST_F(Pieces, OfDaysThatAreForgottenGo) {
  PieceStore pieces = store();
  for (const int day : {-1, 0, 1}) ASSERT_TRUE(pieces.keep("", "x", "0abc", kNoon + day * 24 * kHour).ok());
  pieces.forgetDaysBefore("2026-11-26");
  EXPECT_FALSE(fs::exists(folder / "2026-11-25"));
  EXPECT_TRUE(fs::exists(folder / "2026-11-26/0abc") && fs::exists(folder / "2026-11-27/0abc") &&
              fs::exists(folder / "incoming"));
}

}  // namespace
}  // namespace veltrad::gateway
