// SPDX-License-Identifier: Apache-2.0
// Parts of uploads that real processes do not show: how far a changing file is read, and who gets the next
// place.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <fstream>
#include <memory>
#include <thread>

#include "backends/upload/file_snapshot.h"
#include "backends/upload/file_uploads.h"
#include "base/file_descriptor.h"
#include "fakes/temporary_directory.h"

namespace veltrad {
namespace {

TEST(FileSnapshot, EndsWhereTheFileEndedAtFirst) {
  TemporaryDirectory directory;
  const std::string path = directory.path() + "/file";
  std::ofstream(path) << "0123456789";
  const FileDescriptor file(::open(path.c_str(), O_RDWR | O_CLOEXEC));
  const auto readAll = [&](backends::FileSnapshot& snapshot) {
    std::string all;
    char piece[4];
    while (const auto count = snapshot.read(piece, sizeof piece).value_or(0)) all.append(piece, count);
    return all;
  };
  auto whole = backends::FileSnapshot::of(file.get());
  ASSERT_TRUE(whole && readAll(*whole) == "0123456789" && !whole->changed());
  auto grown = backends::FileSnapshot::of(file.get());
  std::ofstream(path, std::ios::app) << "more";
  EXPECT_TRUE(readAll(*grown) == "0123456789" && grown->changed());
  auto shrunk = backends::FileSnapshot::of(file.get());
  ASSERT_EQ(::ftruncate(file.get(), 6), 0);
  EXPECT_TRUE(readAll(*shrunk) == "012345" && shrunk->changed());
  // Short for a while only, which nobody but the reader has seen.
  auto cut = backends::FileSnapshot::of(file.get());
  struct stat facts {};
  ASSERT_TRUE(::fstat(file.get(), &facts) == 0 && ::ftruncate(file.get(), 3) == 0);
  EXPECT_EQ(readAll(*cut), "012");
  const timespec times[] = {facts.st_atim, facts.st_mtim};
  ASSERT_TRUE(::ftruncate(file.get(), facts.st_size) == 0 && ::futimens(file.get(), times) == 0);
  EXPECT_TRUE(cut->changed());
  auto emptied = backends::FileSnapshot::of(file.get());
  ASSERT_EQ(::ftruncate(file.get(), 0), 0);
  EXPECT_EQ(emptied->content(), backends::FileSnapshot::Content::none);
}

// Called by each waiting upload after it has joined the queue.
struct Stoppable final : http::HTTPClient {
  Result<Done, http::HTTPError> start(http::HTTPRequest, http::HTTPCompletion) override { return Done(); }
  http::HTTPResult perform(http::HTTPRequest) override { return Failure{http::HTTPError{}}; }
  bool stopping() const override {
    ++asked;
    return stop;
  }
  mutable std::atomic<int> asked{0};
  std::atomic<bool> stop{false};
};

// Waiting uploads get places in order of arrival, within the share of each user; a stop ends every wait.
TEST(FileUploads, OneUserLeavesAPlaceToOthers) {
  backends::FileUploads uploads;
  Stoppable http;
  using Place = std::optional<backends::FileUploads::Place>;
  auto first = std::make_unique<Place>(uploads.enter(1, http));
  const Place second = uploads.enter(1, http);
  std::atomic<bool> entered{false}, turnedAway{false};
  const auto wait = [&](std::atomic<bool>& result, bool wanted) {
    return std::thread([&, wanted] { result = uploads.enter(1, http).has_value() == wanted; });
  };
  std::thread third = wait(entered, true);
  while (http.asked < 3) std::this_thread::yield();
  const Place other = uploads.enter(2, http);  // not behind the one who waits for himself
  EXPECT_TRUE(other && !entered);
  first.reset();
  third.join();
  EXPECT_TRUE(entered);
  const Place anonymous = uploads.enter(std::nullopt, http);  // all three are taken
  http.asked = 0;
  std::thread late = wait(turnedAway, false);
  while (http.asked < 1) std::this_thread::yield();
  http.stop = true;
  late.join();
  EXPECT_TRUE(turnedAway);
}

}  // namespace
}  // namespace veltrad
