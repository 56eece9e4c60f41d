// SPDX-License-Identifier: Apache-2.0
// The contents of messages are kept only for watchers, and within the bound.
#include "platform/watched_contents.h"

#include <gtest/gtest.h>

#include "base/property_list.h"
#include "fakes/scarce_memory.h"

namespace veltrad {
namespace {

using platform::WatchedContents;

const Dictionary kUserInfo{{"clientName", "lamp"}};

TEST(WatchedContents, NothingIsKeptOnceNobodyWatches) {
  WatchedContents contents;
  const auto keep = [&](std::uint64_t message) {
    const Dictionary payload{{"n", message}};
    contents.keep(message, &payload, message % 2 == 0 ? &kUserInfo : nullptr);
  };
  keep(1);
  EXPECT_EQ(contents.next(), 1u);
  auto first = contents.watch();
  auto second = contents.watch();
  keep(2);
  first.reset();
  keep(3);
  const auto copy = contents.copy(0);
  ASSERT_EQ(copy.pieces.size(), 2u);
  EXPECT_EQ(copy.next, 3u);
  const auto held = [&](std::size_t i) { return parseBinaryPropertyList(copy.pieces[i].contents).value(); };
  EXPECT_EQ(held(0), Value(Dictionary{{"payload", Dictionary{{"n", 2u}}}, {"userInfo", kUserInfo}}));
  EXPECT_EQ(held(1), Value(Dictionary{{"payload", Dictionary{{"n", 3u}}}}));
  second.reset();
  keep(4);
  EXPECT_TRUE(contents.copy(0).pieces.empty());
  EXPECT_EQ(contents.next(), 3u);
}

TEST(WatchedContents, WithoutMemoryLosesWhatOneMessageHoldsAndNothingElse) {
  const Dictionary payload{{"text", std::string(100, 'x')}};
  forEachShortage([&](const auto& shortOfMemory) {
    WatchedContents contents;
    const auto watch = contents.watch();
    contents.keep(1, &payload, &kUserInfo);
    bool thrown = true;
    shortOfMemory([&] {
      contents.keep(2, &payload, &kUserInfo);
      thrown = false;
    });
    EXPECT_FALSE(thrown);
    contents.keep(3, &payload, &kUserInfo);
    const auto copy = contents.copy(0);
    ASSERT_GE(copy.pieces.size(), 2u);
    EXPECT_EQ(copy.pieces[0].message, 1u);
    EXPECT_EQ(copy.pieces.back().message, 3u);
  });
}

TEST(WatchedContents, TheOldestMakeRoomAndAnAnswerFitsAFrame) {
  for (const std::size_t length : {10u, 5'000u, 900'000u}) {
    WatchedContents contents;
    const auto watch = contents.watch();
    const Dictionary payload{{"text", std::string(length, 'x')}};
    const std::uint64_t messages = WatchedContents::kMostBytes / (length + 100) * 4 / 3;
    for (std::uint64_t message = 1; message <= messages; ++message) contents.keep(message, &payload, nullptr);
    std::size_t bytes = 0;
    std::uint64_t expected = 0;
    auto copy = contents.copy(0);
    for (; !copy.pieces.empty(); copy = contents.copy(copy.next)) {
      Array answer;
      for (const auto& piece : copy.pieces) {
        if (expected != 0) EXPECT_EQ(piece.message, expected);
        expected = piece.message + 1;
        bytes += piece.contents.size();
        answer.push_back(Dictionary{{"message", piece.message}, {"contents", Data{piece.contents}}});
      }
      EXPECT_LT(writeBinaryPropertyList(answer).size(), (1u << 20) - 1000u) << length;
    }
    EXPECT_EQ(expected, messages + 1) << length;
    EXPECT_LE(bytes, WatchedContents::kMostBytes);
    EXPECT_GT(bytes, WatchedContents::kMostBytes / 3) << length;
  }
  WatchedContents contents;
  const auto watch = contents.watch();
  const Dictionary large{{"text", std::string(WatchedContents::kMostOfOne, 'x')}};
  contents.keep(7, &large, nullptr);
  EXPECT_EQ(contents.copy(0).pieces.at(0).message, 7u);
  EXPECT_TRUE(contents.copy(0).pieces.at(0).contents.empty());
}

}  // namespace
}  // namespace veltrad
