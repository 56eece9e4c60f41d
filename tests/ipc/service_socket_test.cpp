// The lock, the socket, the socket handed over.
#include "ipc/service_socket.h"

#include <fcntl.h>
#include <sys/stat.h>

#include "harness.h"

namespace veltrad::ipc_test {
namespace {

std::string errorOf(const platform::Root& root, std::optional<int> handedOver = std::nullopt) {
  const auto opened = ipc::openServiceSocket(root, handedOver);
  return opened ? "" : opened.error();
}

TEST(ServiceSocket, IsOpenToEverybodyAndGoesWithItsMaker) {
  const TemporaryRoot root;
  {
    const auto opened = ipc::openServiceSocket(root, std::nullopt);
    ASSERT_TRUE(opened) << opened.error();
    struct stat found {};
    ASSERT_EQ(::stat(root.socketPath().c_str(), &found), 0);
    EXPECT_EQ(found.st_mode & 0777, 0666u);
    EXPECT_EQ(::fcntl(opened.value().listening(), F_GETFD), FD_CLOEXEC);
    EXPECT_EQ(errorOf(root), "The daemon is already running: process " + std::to_string(::getpid()) +
                                 " holds " + root.lockPath() +
                                 ". Stop it first, or give this one a root of its own in VELTRA_ROOT.");
    EXPECT_TRUE(std::filesystem::exists(root.socketPath())) << "the second daemon must not touch it";
  }
  EXPECT_FALSE(std::filesystem::exists(root.socketPath()));
  EXPECT_EQ(errorOf(root), "");
  std::filesystem::remove_all(root.runDirectory());
  EXPECT_EQ(errorOf(root), "The lock " + root.lockPath() + " cannot be opened: No such file or directory.");
}

TEST(ServiceSocket, IsTheOneHandedOverIfThatListens) {
  const TemporaryRoot root;
  auto given = unixSocket(::bind, root.path("activated.sock"));
  EXPECT_THAT(errorOf(root, ::dup(given.get())), HasSubstr("does not listen"));
  ASSERT_EQ(::listen(given.get(), 5), 0);
  EXPECT_EQ(errorOf(root, given.release()), "");
  EXPECT_FALSE(std::filesystem::exists(root.socketPath()));
  EXPECT_TRUE(std::filesystem::exists(root.path("activated.sock")));
  EXPECT_THAT(errorOf(root, ::open("/dev/null", O_RDONLY)), HasSubstr("is no Unix stream socket"));
}

}  // namespace
}  // namespace veltrad::ipc_test
