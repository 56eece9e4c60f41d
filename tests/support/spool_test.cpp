// SPDX-License-Identifier: Apache-2.0
// The spool's files and its index: files are complete or absent, in order, and within the bounds.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>

#include "base/property_list.h"
#include "fakes/few_descriptors.h"
#include "fakes/temporary_directory.h"
#include "platform/file_store.h"
#include "support/spool_age.h"
#include "support/spool_entry.h"
#include "support/spool_folder.h"
#include "support/spool_index.h"

namespace veltrad {
namespace {

using support::SpoolEntry;
using support::SpoolIndex;
using support::SpoolPlace;

SpoolEntry post(std::uint64_t order) {
  SpoolEntry entry;
  entry.id = support::newPostID();
  entry.order = order;
  entry.url = "https://h.test:8443/events";
  entry.headers = {{"X-VLT-Sender", "7"}, {"User-Agent", "grün"}};
  entry.body = std::string("\x1f\x8b\0body", 7);
  entry.events = 3;
  entry.uid = 1000;
  entry.connection = 4'000'000'000u;
  entry.asksEntry = true;
  entry.client = {{"clientType", 7}, {"client", "phone"}};
  entry.about = {{"backend", "httppost"}, {"removed", Array{"mac"}}};
  entry.tries = 2;
  entry.lastError = "HTTP 503";
  return entry;
}

TEST(SpoolEntry, IsReadAsItWasWrittenOrNotAtAll) {
  const SpoolEntry written = post(5);
  const std::string file = support::writeSpoolEntry(written);
  const auto read = support::readSpoolEntry(file);
  ASSERT_TRUE(read);
  EXPECT_TRUE(read->id == written.id && read->order == 5 && read->url == written.url &&
              read->headers == written.headers && read->body == written.body && read->events == 3 &&
              read->uid == 1000 && read->connection == written.connection && read->asksEntry &&
              read->client == written.client && read->about == written.about && !read->namesHidden &&
              read->tries == 2 && read->lastError == "HTTP 503");
  for (std::size_t i = 0; i < file.size(); ++i) {
    std::string flipped = file;
    flipped[i] = static_cast<char>(flipped[i] ^ 4);
    EXPECT_FALSE(support::readSpoolEntry(flipped) || support::readSpoolEntry(file.substr(0, i))) << i;
  }
  // Good lists that are no post.
  const std::string list = file.substr(8, file.size() - 12);
  ASSERT_TRUE(support::readSpoolContent(list));
  for (const char* key : {"id", "url", "headers", "body", "client", "about"}) {
    Dictionary all = *parseBinaryPropertyList(list).value().asDictionary();
    all.set(key, 1);
    EXPECT_FALSE(support::readSpoolContent(writeBinaryPropertyList(all))) << key;
  }
}

TEST(SpoolFolder, KeepsWholeFilesOfItsOwnerAndRemovesWhatIsUnfinished) {
  const TemporaryDirectory directory;
  platform::DiskFileStore files;
  const support::SpoolFolder folder(files, directory.path() + "/spool");
  ASSERT_TRUE(folder.make());
  const auto put = [&](const std::string& name, const std::string& bytes) {
    std::ofstream(folder.directory() + "/" + name) << bytes;
  };
  const mode_t mask = ::umask(0);
  std::vector<support::SpoolFolder::Name> written;
  for (const std::uint64_t order : {30u, 10u, 20u}) {
    const SpoolEntry entry = post(order);
    written.push_back({order, entry.id});
    ASSERT_TRUE(folder.write(written.back(), support::writeSpoolEntry(entry)));
  }
  ::umask(mask);
  for (const auto& file : std::filesystem::directory_iterator(folder.directory())) {
    EXPECT_EQ(file.status().permissions(), std::filesystem::perms(0600));
  }
  put("000000000000000f." + support::textOf(written[0].id) + ".0123abcd.new", "half");
  put("another", "");
  const auto listed = folder.names(0);
  ASSERT_TRUE(listed && listed->size() == 3);
  const auto& names = *listed;
  EXPECT_TRUE(names[0].order == 10 && names[1].order == 20 && names[2].order == 30);
  EXPECT_EQ(folder.read(names[1]).entry->id, names[1].id);
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(folder.directory()), {}), 4);
  std::filesystem::resize_file(folder.directory() + "/000000000000000a." + support::textOf(names[0].id), 50);
  EXPECT_TRUE(folder.read(names[0]).torn);
  folder.remove(names[1]);
  EXPECT_TRUE(!folder.read(names[1]).entry && !folder.read(names[1]).torn);
  std::filesystem::remove(folder.directory() + "/another");
  const auto removed = folder.removeAll();
  EXPECT_TRUE(removed.posts == 1 && removed.events == 3 && removed.torn == 1 && removed.all);
  EXPECT_FALSE(std::filesystem::exists(folder.directory()));
}

TEST(SpoolFolder, IsClosedToOthersAndListedWhenThereAreDescriptors) {
  const TemporaryDirectory directory;
  platform::DiskFileStore files;
  const support::SpoolFolder folder(files, directory.path() + "/spool");
  ASSERT_TRUE(std::filesystem::create_directory(folder.directory()));
  std::filesystem::permissions(folder.directory(), std::filesystem::perms(0755));
  ASSERT_TRUE(folder.make());
  EXPECT_EQ(std::filesystem::status(folder.directory()).permissions(), std::filesystem::perms(0700));
  // Two posts under a clock that was in the year 2040, and two of now.
  constexpr std::uint64_t kAhead = 2'208'988'800'000'000, kNow = 1'790'000'000'000'000;
  const SpoolEntry before = post(kNow - 5), first = post(kAhead), second = post(kAhead + 7), now = post(kNow);
  for (const SpoolEntry& one : {second, before, now, first})
    ASSERT_TRUE(folder.write({one.order, one.id}, support::writeSpoolEntry(one)));
  {
    const FewDescriptors none;
    EXPECT_FALSE(folder.names(kNow / 1e6));
    EXPECT_TRUE(folder.read({now.order, now.id}).passes);
    EXPECT_FALSE(folder.removeAll().all);
  }
  const std::pair<std::uint64_t, support::PostID> brought[] = {
      {kNow - 5, before.id}, {kNow - 2, now.id}, {kNow - 1, first.id}, {kNow, second.id}};
  for (int turn = 0; turn < 2; ++turn) {  // the second time, nothing is left to do
    const auto names = folder.names(kNow / 1e6);
    ASSERT_TRUE(names && names->size() == 4);
    for (std::size_t i = 0; i < 4; ++i) {
      EXPECT_TRUE((*names)[i].order == brought[i].first && (*names)[i].id == brought[i].second) << i;
      EXPECT_EQ(folder.read((*names)[i]).entry->order, brought[i].first);
    }
  }
}

TEST(SpoolAge, CountsDaysByTheClockOrWhereItWasWrongByTheTimeThatHasPassed) {
  constexpr double kDay = 86'400, kNow = 1'790'000'000;
  const auto order = [](double time) { return static_cast<std::uint64_t>(time * 1e6); };
  support::SpoolAge age(7 * kDay);
  const std::uint64_t good = order(kNow - kDay), ahead = order(kNow + 1000 * kDay), early = order(1000);
  EXPECT_EQ(age.tooOldBefore(kNow, 0, good, good), order(kNow - 7 * kDay));
  for (const std::uint64_t oldest : {ahead, early}) {
    EXPECT_EQ(age.tooOldBefore(kNow, 1000, oldest, ahead + 9), 0u);
    EXPECT_EQ(age.tooOldBefore(kNow, 1000 + 6 * kDay, oldest, ahead + 20), 0u);
    EXPECT_EQ(age.tooOldBefore(kNow, 1000 + 7 * kDay, oldest, ahead + 20), ahead + 10);
    // Those that were made meanwhile have days of their own.
    EXPECT_EQ(age.tooOldBefore(kNow, 1000 + 8 * kDay, ahead + 12, ahead + 20), 0u);
    EXPECT_EQ(age.tooOldBefore(kNow, 1000 + 15 * kDay, ahead + 12, ahead + 20), ahead + 21);
    age.tooOldBefore(kNow, 0, good, good);  // well again
  }
  EXPECT_EQ(age.tooOldBefore(1000, 0, good, good), 0u);  // no clock at all
  EXPECT_EQ(age.tooOldBefore(kNow, 0, good, good), order(kNow - 7 * kDay));
}

class SpoolIndexTest : public ::testing::Test {
 protected:
  void add(std::uint64_t order, const std::string& address, std::uint32_t uid, std::uint32_t connection,
           std::uint32_t bytes, SpoolPlace::State state = SpoolPlace::State::waiting) {
    SpoolPlace place;
    place.name.order = order;
    place.address = _index.addressNumber(address);
    place.user = _index.userNumber(uid);
    place.connection = connection;
    place.bytes = bytes;
    place.state = state;
    _index.add(place);
  }
  std::uint64_t next(const std::string& address, bool oldestAlone = false) {
    const SpoolPlace* place = _index.next(_index.addressNumber(address), oldestAlone);
    return place ? place->name.order : 0;
  }
  // The orders of those that go, until nothing has to.
  std::vector<std::pair<std::uint64_t, SpoolIndex::Excess>> excess() {
    std::vector<std::pair<std::uint64_t, SpoolIndex::Excess>> gone;
    auto why = SpoolIndex::Excess::full;
    while (SpoolPlace* place = _index.excess(why)) {
      gone.emplace_back(place->name.order, why);
      _index.takeOut(*place);
    }
    return gone;
  }

  SpoolIndex _index{{1000, 0.5, 6}};
};

TEST_F(SpoolIndexTest, OfASessionAndAddressTheNextLeavesAfterTheOneBefore) {
  using State = SpoolPlace::State;
  add(1, "a", 0, 1, 10, State::sending);
  add(2, "a", 0, 1, 10);
  add(3, "b", 0, 1, 10);
  add(5, "a", 0, 2, 10);
  add(4, "a", 0, 2, 10, State::writing);
  EXPECT_EQ(next("a"), 0u);
  add(6, "a", 0, 3, 10);
  EXPECT_EQ(next("a"), 6u);
  EXPECT_EQ(next("a", true), 0u);
  EXPECT_EQ(next("b", true), 3u);
  _index.takeOut(*_index.find(1));
  EXPECT_EQ(next("a", true), 2u);
  _index.find(4)->state = State::waiting;
  _index.takeOut(*_index.find(2));
  EXPECT_EQ(next("a"), 4u);
  EXPECT_EQ(_index.next(0, false, [](const SpoolPlace& place) { return place.connection == 2; })->name.order,
            6u);
  EXPECT_TRUE(_index.holdsOf(2, 0) && !_index.holdsOf(1, 0) && _index.holdsOf(1, 1));
  EXPECT_EQ(_index.amountAt(0).oldest, 4u);
  EXPECT_EQ(_index.find(2), nullptr);
}

TEST_F(SpoolIndexTest, TheOldestOfWhoTakesMostGoes) {
  using enum SpoolIndex::Excess;
  using Gone = std::vector<std::pair<std::uint64_t, SpoolIndex::Excess>>;
  add(1, "a", 10, 1, 400);
  add(2, "a", 20, 1, 300);
  EXPECT_EQ(excess(), Gone());
  add(3, "a", 20, 1, 201);  // above its half
  EXPECT_EQ(excess(), (Gone{{2, share}}));
  add(4, "a", 30, 1, 400);  // 1001 in all; two take most, and the first of them is it
  EXPECT_EQ(excess(), (Gone{{1, full}}));
  for (const std::uint64_t order : {5u, 6u, 7u, 8u, 9u}) add(order, "a", 40, 1, 1);  // seven posts
  EXPECT_EQ(excess(), (Gone{{5, full}}));
  add(10, "a", 50, 1, 501);  // alone too large
  EXPECT_EQ(excess(), (Gone{{10, share}}));
  _index.setBytes(*_index.find(4), 600);
  _index.find(4)->state = SpoolPlace::State::sending;  // stays
  EXPECT_EQ(excess(), Gone());
  EXPECT_TRUE(_index.size() == 6 && _index.bytes() == 805);
}

TEST_F(SpoolIndexTest, KeepsItsCountsWhileItTurnsOver) {
  for (std::uint64_t order = 1; order < 5000; ++order) {
    add(order, order % 2 ? "a" : "b", 0, static_cast<std::uint32_t>(order % 7), 2);
    if (order > 4) _index.takeOut(*_index.find(order - 4));
  }
  std::vector<std::uint64_t> orders;
  _index.visit(4996, [&](const SpoolPlace& place) {
    orders.push_back(place.name.order);
    return true;
  });
  EXPECT_EQ(orders, (std::vector<std::uint64_t>{4997, 4998, 4999}));
  EXPECT_TRUE(_index.size() == 4 && _index.bytes() == 8 && next("a") == 4997 && next("b") == 4996);
}

}  // namespace
}  // namespace veltrad
