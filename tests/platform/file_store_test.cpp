// SPDX-License-Identifier: Apache-2.0
// Files on a real disk, and their state after a fault.
#include "platform/file_store.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include "fakes/temporary_directory.h"

namespace veltrad::platform {
namespace {

using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::UnorderedElementsAre;
using Kind = platform::FileFailure::Kind;

constexpr std::size_t kMost = 1u << 20;

class DiskFileStoreTest : public ::testing::Test {
 protected:
  platform::FileStamp stampOf(const std::string& path) { return _files.stamp(path).value(); }
  TemporaryDirectory _directory;
  platform::DiskFileStore _files;
};

TEST_F(DiskFileStoreTest, ReplacesWholeWithTheModeAskedForAndLeavesNothingElse) {
  _directory.write("elsewhere", "untouched");
  std::filesystem::create_symlink("elsewhere", _directory.path("x"));
  const mode_t before = ::umask(077);
  ASSERT_TRUE(_files.replace(_directory.path("x"), std::string_view("a\0b", 3), 0644));
  ::umask(before);
  EXPECT_EQ(_files.read(_directory.path("x"), kMost).value(), std::string("a\0b", 3));
  struct stat status {};
  ASSERT_EQ(::lstat(_directory.path("x").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode, S_IFREG | 0644u);
  EXPECT_EQ(_directory.read("elsewhere"), "untouched");
  EXPECT_THAT(_directory.names(), UnorderedElementsAre("elsewhere", "x"));
}

TEST_F(DiskFileStoreTest, AFailureLeavesTheOldFileAndNoNewOne) {
  _directory.write("x", "old");
  std::filesystem::create_directory(_directory.path("directory"));
  rlimit before{};
  ::getrlimit(RLIMIT_FSIZE, &before);
  const auto handler = ::signal(SIGXFSZ, SIG_IGN);
  const rlimit small{4'096, before.rlim_max};
  ::setrlimit(RLIMIT_FSIZE, &small);
  const auto full = _files.replace(_directory.path("x"), std::string(10'000, 'n'), 0600);
  ::setrlimit(RLIMIT_FSIZE, &before);
  ::signal(SIGXFSZ, handler);
  ASSERT_FALSE(full);
  EXPECT_EQ(full.error().kind, Kind::tooLarge);
  EXPECT_EQ(_directory.read("x"), "old");
  const auto occupied = _files.replace(_directory.path("directory"), "new", 0600);
  ASSERT_FALSE(occupied);
  EXPECT_THAT(occupied.error().description, HasSubstr(_directory.path("directory") + ": "));
  EXPECT_THAT(_directory.names(), UnorderedElementsAre("x", "directory"));
}

TEST_F(DiskFileStoreTest, ReadsWithinItsBoundAndRegularFilesAlone) {
  _directory.write("x", std::string(5'000, 'x'));
  EXPECT_EQ(_files.read(_directory.path("x"), 5'000).value().size(), 5'000u);
  EXPECT_EQ(_files.read(_directory.path("x"), 4'999).error().kind, Kind::tooLarge);

  ASSERT_EQ(::mkfifo(_directory.path("pipe").c_str(), 0600), 0);
  EXPECT_THAT(_files.read(_directory.path("pipe"), kMost).error().description,
              EndsWith("not a regular file"));
  EXPECT_EQ(_files.read(_directory.path(), kMost).error().kind, Kind::other);

  const auto missing = _files.read(_directory.path("none"), kMost);
  EXPECT_EQ(missing.error().kind, Kind::notFound);
  EXPECT_EQ(missing.error().description, _directory.path("none") + ": No such file or directory");

  // A size of 0 is no promise.
  EXPECT_FALSE(_files.read("/proc/self/status", kMost).value().empty());
  EXPECT_EQ(_files.read("/proc/self/status", 10).error().kind, Kind::tooLarge);
}

}  // namespace
}  // namespace veltrad::platform
