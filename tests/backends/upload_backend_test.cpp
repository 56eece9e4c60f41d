// What real processes do not show of uploads: how far a file is read that changes meanwhile.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <fstream>

#include "backends/upload/file_snapshot.h"
#include "fakes/temporary_directory.h"
#include "platform/file_descriptor.h"

namespace veltrad {
namespace {

TEST(FileSnapshot, EndsWhereTheFileEndedAtFirst) {
  TemporaryDirectory directory;
  const std::string path = directory.path() + "/file";
  std::ofstream(path) << "0123456789";
  const platform::FileDescriptor file(::open(path.c_str(), O_RDWR | O_CLOEXEC));
  const auto readAll = [&](FileSnapshot& snapshot) {
    std::string all;
    char piece[4];
    while (const auto count = snapshot.read(piece, sizeof piece).value_or(0)) all.append(piece, count);
    return all;
  };
  auto whole = FileSnapshot::of(file.get());
  ASSERT_TRUE(whole && readAll(*whole) == "0123456789" && !whole->changed());
  auto grown = FileSnapshot::of(file.get());
  std::ofstream(path, std::ios::app) << "more";
  EXPECT_TRUE(readAll(*grown) == "0123456789" && grown->changed());
  auto shrunk = FileSnapshot::of(file.get());
  ASSERT_EQ(::ftruncate(file.get(), 6), 0);
  EXPECT_TRUE(readAll(*shrunk) == "012345" && shrunk->changed());
  auto emptied = FileSnapshot::of(file.get());
  ASSERT_EQ(::ftruncate(file.get(), 0), 0);
  EXPECT_EQ(emptied->content(), FileSnapshot::Content::none);
}

}  // namespace
}  // namespace veltrad
