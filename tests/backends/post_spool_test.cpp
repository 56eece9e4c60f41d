// SPDX-License-Identifier: Apache-2.0
// The spool and its sender over a real folder: shortages, a fetch that hangs, disk errors, and a withdrawal
// of consent.
#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <functional>
#include <map>
#include <mutex>
#include <new>
#include <set>
#include <thread>

#include "backends/https/spool_sender.h"
#include "config/owner_gate.h"
#include "config/preference_keys.h"
#include "fakes/few_descriptors.h"
#include "fakes/machine.h"
#include "fakes/recorded_log.h"
#include "fakes/temporary_directory.h"
#include "platform/counters.h"
#include "platform/device_secret.h"
#include "support/device_identity.h"

namespace veltrad {
namespace {

using namespace std::chrono_literals;
using backends::PostSpool;
using backends::SpoolSender;
using enum wire::Reason;
using http::HTTPError;

bool waitFor(const std::function<bool()>& condition) {
  for (const auto end = std::chrono::steady_clock::now() + 20s; !condition();
       std::this_thread::sleep_for(2ms)) {
    if (std::chrono::steady_clock::now() > end) return false;
  }
  return true;
}

// A real disk, on which files can be kept from being read or removed. Any thread.
class StubbornDisk final : public platform::FileStore {
 public:
  using Failed = platform::FileFailure;
  Result<std::string, Failed> read(const std::string& path, std::size_t most) override {
    if (isStubborn(_unread, path)) return Failure{Failed{Failed::Kind::shortage, path}};
    return _disk.read(path, most);
  }
  Result<Done, Failed> replace(const std::string& path, std::string_view bytes, unsigned mode) override {
    return _disk.replace(path, bytes, mode);
  }
  Result<Done, Failed> rename(const std::string& from, const std::string& to) override {
    return _disk.rename(from, to);
  }
  Result<Done, Failed> unlink(const std::string& path) override {
    if (isStubborn(_unremoved, path)) return Failure{Failed{Failed::Kind::other, path}};
    const std::lock_guard held(_mutex);
    removers.insert(std::this_thread::get_id());
    return _disk.unlink(path);
  }
  Result<platform::FileStamp, Failed> stamp(const std::string& path) override { return _disk.stamp(path); }

  // Makes paths that contain this text unreadable; an empty text makes none unreadable.
  void keepUnread(const std::string& part) { set(_unread, part); }
  void keepThere(const std::string& part) { set(_unremoved, part); }
  std::set<std::thread::id> removers;

 private:
  bool isStubborn(const std::string& part, const std::string& path) {
    const std::lock_guard held(_mutex);
    return !part.empty() && path.find(part) != std::string::npos;
  }
  void set(std::string& part, const std::string& to) {
    const std::lock_guard held(_mutex);
    part = to;
  }
  platform::DiskFileStore _disk;
  std::mutex _mutex;
  std::string _unread, _unremoved;
};

// Holds each post until it is answered, on a thread of its own. Any thread.
class HeldHTTPClient final : public http::HTTPClient {
 public:
  Result<Done, HTTPError> start(http::HTTPRequest request, http::HTTPCompletion completion) override {
    const std::lock_guard held(_mutex);
    if (_noMemory-- > 0) throw std::bad_alloc();
    _held.emplace(request.url, std::move(completion));
    return Done();
  }
  http::HTTPResult perform(http::HTTPRequest) override { return Failure{HTTPError{}}; }

  bool holds(const std::string& url) {
    const std::lock_guard held(_mutex);
    return _held.contains(url);
  }
  // Returns the thread that it was done on.
  std::thread::id answer(const std::string& url, http::HTTPResult result) {
    const bool came = waitFor([&] { return holds(url); });
    EXPECT_TRUE(came) << url;
    if (!came) return {};
    std::thread answering([&] {
      std::unique_lock held(_mutex);
      auto completion = std::move(_held.extract(url).mapped());
      held.unlock();
      completion(std::move(result));
    });
    const auto id = answering.get_id();
    answering.join();
    return id;
  }
  void runShort(int times) { _noMemory = times; }

 private:
  std::mutex _mutex;
  std::map<std::string, http::HTTPCompletion> _held;
  int _noMemory = 0;
};

// Provides a section that lets "phone" report without consent, as soon as it may answer.
class HangingSections final : public backends::SectionSource {
 public:
  std::shared_ptr<const config::StorebagSection> sectionFor(std::int32_t, bool fetch) override {
    std::unique_lock held(_mutex);
    if (fetch) _changed.wait(held, [this] { return _answers; });
    return _answers ? _section : nullptr;
  }
  void answer(bool answers = true) {
    const std::lock_guard held(_mutex);
    _answers = answers;
    _changed.notify_all();
  }

 private:
  std::mutex _mutex;
  std::condition_variable _changed;
  bool _answers = false;
  const std::shared_ptr<const config::StorebagSection> _section = config::parseSection(
      {{"httppost", Dictionary{{"clients", Array{Dictionary{{"client", "phone"},
                                                            {"override_dnu", 1},
                                                            {"locale_whitelist", Array{"DE"}},
                                                            {"filters", Array{}}}}}}}});
};

class PostSpoolTest : public ::testing::Test {
 protected:
  PostSpoolTest() {
    consent(true);
    gate.refresh();
    EXPECT_TRUE(folder.make());
  }
  ~PostSpoolTest() override { sections.answer(); }

  void consent(bool given) { preferences.set(config::preference::kConsent, given); }
  // The file of a post to http://h.test/ORDER.
  support::SpoolFolder::Name put(std::uint64_t order, bool asksEntry = true) {
    support::SpoolEntry post = entry(order, asksEntry);
    EXPECT_TRUE(folder.write({order, post.id}, support::writeSpoolEntry(post)));
    return {order, post.id};
  }
  static std::string url(std::uint64_t order) { return "https://h.test/" + std::to_string(order); }
  static support::SpoolEntry entry(std::uint64_t order, bool asksEntry = true) {
    support::SpoolEntry post;
    post.id = support::newPostID();
    post.order = order;
    post.url = url(order);
    post.events = 2;
    post.connection = static_cast<std::uint32_t>(order);
    post.asksEntry = asksEntry;
    post.client = {{"clientType", 7}, {"client", "phone"}};
    post.about = {{"backend", "httppost"}};
    return post;
  }
  std::shared_ptr<backends::SpooledPost> fresh() {
    const auto post = std::make_shared<backends::SpooledPost>();
    post->entry = entry(0, false);
    return post;
  }
  // Begins as at a daemon's start.
  void start() {
    sender.emplace(spool(), http, sections);
    EXPECT_TRUE(sender->start());
  }
  void end() {
    sections.answer();  // else the fetch is waited for
    sender.reset();
    made.reset();
  }
  PostSpool& spool() {
    if (!made)
      made.emplace(
          backends::SpoolServices{
              clock, counters, disk, writer, {gate, preferences, locale, device}, nullptr},
          backends::SpoolSettings{folder.directory(), {}, 7, {1000, 0.05, 0.05}});
    return *made;
  }
  std::size_t files() const {
    return static_cast<std::size_t>(
        std::distance(std::filesystem::directory_iterator(folder.directory()), {}));
  }
  bool loaded(std::size_t posts) {
    return waitFor([&] { return spool().queue().isLoaded() && spool().queue().amount().posts == posts; });
  }
  std::size_t empty() { return spool().empty(privacy_off, std::chrono::steady_clock::now() + 5s); }

  const TemporaryDirectory directory;
  StubbornDisk disk;
  FakeFileStore settings;
  FakeClock clock;
  FakePreferences preferences;
  FakeLocale locale;
  FakeDeviceProperties properties;
  support::DeviceIdentity device{properties};
  config::OwnerPolicy policy{settings, "/policy.json"};
  platform::DeviceSecret secret{settings, "/secret"};
  config::DailyAllowance day{settings, clock, "/day"};
  config::OwnerGate gate{policy, preferences, secret, day};
  platform::Counters counters;
  platform::DiskWriter writer;
  HeldHTTPClient http;
  HangingSections sections;
  support::SpoolFolder folder{disk, directory.path() + "/spool"};
  std::optional<PostSpool> made;
  std::optional<SpoolSender> sender;
};

// In microseconds, shortly before the clock's time.
constexpr std::uint64_t kOrder = 1'699'999'000'000'000;

TEST_F(PostSpoolTest, AStorebagThatHangsHoldsPostsBackAndNeitherAWithdrawalNorTheOwnersOff) {
  put(kOrder, false), put(kOrder + 1);
  start();
  ASSERT_TRUE(loaded(2));
  http.answer(url(kOrder), http::HTTPResponse{200, {}, {}});  // asks no storebag
  ASSERT_TRUE(loaded(1));
  consent(false);
  EXPECT_TRUE(waitFor([this] { return files() == 0; }));
  EXPECT_TRUE(counters.value(spool_no_consent) == 2 && !http.holds(url(kOrder + 1)));
  consent(true);
  end();
  sections.answer(false);
  for (std::uint64_t i = 0; i < 30; ++i) put(kOrder + i);
  const auto begin = std::chrono::steady_clock::now();
  start();
  EXPECT_EQ(empty(), 30u);
  EXPECT_EQ(files(), 0u);
  EXPECT_LT(std::chrono::steady_clock::now() - begin, 3s);
  EXPECT_EQ(counters.value(spool_privacy_off), 60u);
}

TEST_F(PostSpoolTest, WithoutConsentAtStartThePostWaitsForTheStorebagThatOverridesIt) {
  consent(false);
  put(kOrder);
  start();
  ASSERT_TRUE(loaded(1));
  sections.answer();
  http.answer(url(kOrder), http::HTTPResponse{200, {}, {}});
  EXPECT_TRUE(waitFor([this] { return files() == 0; }));
  EXPECT_EQ(counters.value(event_posted), 2u);
}

TEST_F(PostSpoolTest, EmptiesAtOnceWhatNobodyReads) {
  for (std::uint64_t i = 0; i < 3; ++i) put(kOrder + i);
  EXPECT_EQ(empty(), 3u);  // without a sender, too
  EXPECT_EQ(files(), 0u);
  EXPECT_EQ(counters.value(spool_privacy_off), 6u);
}

TEST_F(PostSpoolTest, AFileThatCannotBeReadYetCountsAndIsReadLater) {
  sections.answer();
  const auto name = put(kOrder), other = put(kOrder + 1);
  disk.keepUnread(support::textOf(name.id));
  start();
  ASSERT_TRUE(loaded(2));
  std::uintmax_t bytes = 0;
  for (const auto& file : std::filesystem::directory_iterator(folder.directory())) bytes += file.file_size();
  EXPECT_TRUE(spool().queue().amount().bytes == bytes && spool().queue().addresses().size() == 1);
  disk.keepUnread("");
  for (const auto& each : {name, other}) http.answer(url(each.order), http::HTTPResponse{200, {}, {}});
  EXPECT_TRUE(waitFor([this] { return files() == 0; }));
  end();
  disk.keepUnread(support::textOf(put(kOrder).id));
  start();
  ASSERT_TRUE(loaded(1));
  EXPECT_EQ(empty(), 1u);
  EXPECT_EQ(files(), 0u);
}

TEST_F(PostSpoolTest, WhatCannotBeToldForAShortageIsNotDropped) {
  sections.answer();
  put(kOrder);
  properties.runShort(true);
  start();
  ASSERT_TRUE(loaded(1));
  const auto late = fresh();  // one that is kept meanwhile
  late->entry.asksEntry = true;
  ASSERT_TRUE(spool().admit(*late));
  spool().keep(late);
  ASSERT_TRUE(spool().drain(std::chrono::steady_clock::now() + 5s));
  EXPECT_TRUE(files() == 2 && !http.holds(url(kOrder)));
  properties.runShort(false);
  for (const std::uint64_t order : {kOrder, std::uint64_t{0}})
    http.answer(url(order), http::HTTPResponse{200, {}, {}});
  EXPECT_TRUE(waitFor([this] { return files() == 0; }));
}

TEST_F(PostSpoolTest, WhatThisEndCannotBeginIsKeptAndSaysNothingOfTheAddress) {
  start();
  ASSERT_TRUE(loaded(0));
  const auto one = fresh(), two = fresh(), three = fresh();
  two->entry.connection = 1;
  three->entry.connection = 2;
  ASSERT_FALSE(spool().admit(*one));
  spool().ended(one, Failure{HTTPError{HTTPError::Kind::tooMany, "full"}});
  EXPECT_FALSE(spool().admit(*two));  // another session posts at once
  spool().ended(two, Failure{HTTPError{HTTPError::Kind::transport, "cut"}});
  EXPECT_EQ(spool().admit(*three), "cut");
}

TEST_F(PostSpoolTest, ARefusedTryLeavesTheDiskToTheSpoolsThread) {
  put(kOrder, false);
  start();
  HTTPError refused{HTTPError::Kind::refused, "no"};
  refused.refusal = over_daily_limit;
  const auto answering = http.answer(url(kOrder), Failure{refused});
  EXPECT_TRUE(waitFor([this] { return files() == 0; }));
  EXPECT_EQ(counters.value(spool_over_daily_limit), 2u);
  end();
  EXPECT_TRUE(disk.removers.size() == 1 && !disk.removers.contains(answering));
}

TEST_F(PostSpoolTest, AFileThatCannotBeRemovedIsCountedAndTriedAgain) {
  RecordedLog log;
  log.expectLine(platform::LogLevel::error, "cannot be removed from the spool, and is tried again: ");
  disk.keepThere("/spool/");
  put(kOrder, false);
  start();
  http.answer(url(kOrder), http::HTTPResponse{200, {}, {}});
  ASSERT_TRUE(waitFor([this] { return counters.value(spool_file_stays) == 1; }));
  EXPECT_TRUE(loaded(0) && files() == 1);
  disk.keepThere("");
  EXPECT_TRUE(waitFor([this] { return files() == 0; }));
  EXPECT_EQ(counters.value(spool_file_stays), 1u);
}

TEST_F(PostSpoolTest, GoesOnAfterAShortageOfMemoryThreadsOrDescriptors) {
  RecordedLog log;
  log.expectLine(platform::LogLevel::warning, "The spool goes on a little later: no memory");
  put(kOrder, false);
  http.runShort(1);
  sender.emplace(spool(), http, sections);
  {
    const FewDescriptors none;
    EXPECT_FALSE(sender->start());
  }
  EXPECT_TRUE(sender->start());
  http.answer(url(kOrder), http::HTTPResponse{200, {}, {}});
  EXPECT_TRUE(waitFor([this] { return files() == 0; }));
}

}  // namespace
}  // namespace veltrad
