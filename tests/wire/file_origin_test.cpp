// SPDX-License-Identifier: Apache-2.0
// The kinds of file systems. tests/e2e/test_uploads.py tests real mounts, which it can make.
#include "wire/file_origin.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include "base/file_descriptor.h"

namespace veltrad::platform {
namespace {

TEST(FileOrigin, TypesOfMountsAndTheirVerdicts) {
  constexpr std::string_view kMounts =
      "27 1 254:0 / / rw,relatime shared:1 - ext4 /dev/vda rw\n"
      "42 27 0:39 / /mnt/a\\040-\\040b rw,nosuid - fuse.sshfs me@there:/ rw,user_id=1000\n"
      "142 27 0:40 / /run rw master:2 propagate_from:1 - tmpfs tmpfs rw\n"
      "9 27 0:41 / /cut";
  using Kind = wire::FileOrigin::Kind;
  const std::tuple<const char*, const char*, Kind> cases[] = {
      {"27", "ext4", Kind::local},   {"42", "fuse.sshfs", Kind::foreign},
      {"142", "tmpfs", Kind::local}, {"9", "", Kind::foreign},
      {"2", "", Kind::foreign},      {"", "", Kind::foreign}};
  for (const auto& [number, type, kind] : cases) {
    const std::string found = wire::typeOfMount(kMounts, number).value_or("");
    EXPECT_TRUE(found == type && wire::kindOfFileSystem(found) == kind) << number;
  }
  for (const char* type : {"fuse", "fuseblk", "nfs4", "cifs", "9p", "virtiofs", "ceph", "ext44"}) {
    EXPECT_EQ(wire::kindOfFileSystem(type), Kind::foreign) << type;
  }
  EXPECT_EQ(wire::kindOfFileSystem("overlay"), Kind::stacked);
}

TEST(FileOrigin, OfDescriptors) {
  const FileDescriptor memory(::memfd_create("x", MFD_CLOEXEC)),
      process(::open("/proc/self/status", O_RDONLY)), directory(::open("/", O_RDONLY)),
      socket(::socket(AF_UNIX, SOCK_STREAM, 0));
  EXPECT_EQ(wire::FileOrigin::of(memory.get(), 0).kind, wire::FileOrigin::Kind::local);
  EXPECT_EQ(wire::FileOrigin::of(process.get(), 0).fileSystem, "proc");
  EXPECT_EQ(wire::FileOrigin::of(socket.get(), ::getpid()).kind, wire::FileOrigin::Kind::foreign);
  EXPECT_TRUE(wire::isNoRegularFile(directory.get()) && wire::isNoRegularFile(socket.get()));
  EXPECT_FALSE(wire::isNoRegularFile(memory.get()) || wire::isNoRegularFile(process.get()));
}

TEST(FileOrigin, OfAMountThatNoListHasAsBelowAChroot) {
  for (const char* path : {"/proc/self/exe", "/dev/shm"}) {
    const FileDescriptor mounted(::open_tree(AT_FDCWD, path, OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC));
    if (!mounted.isOpen()) GTEST_SKIP() << "only root may clone a mount";
    struct stat facts {};
    ASSERT_EQ(::fstat(mounted.get(), &facts), 0);
    const auto expected =
        major(facts.st_dev) == 0 ? wire::FileOrigin::Kind::foreign : wire::FileOrigin::Kind::local;
    EXPECT_EQ(wire::FileOrigin::of(mounted.get(), 0).kind, expected) << path;
    EXPECT_EQ(wire::FileOrigin::of(mounted.get(), ::getpid()).kind, expected) << path;
  }
}

}  // namespace
}  // namespace veltrad::platform
