// The lock, the stale socket, the socket handed over.
#include "ipc/service_socket.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <fstream>

#include "harness.h"

namespace veltrad::ipc_test {
namespace {

class ServiceSocketTest : public testing::Test {
 protected:
  ServiceSocketTest() : root(makeDirectory()) {}
  ~ServiceSocketTest() override { std::filesystem::remove_all(root.directory()); }
  static std::string makeDirectory() {
    char name[] = "/tmp/veltra-door-XXXXXX";
    EXPECT_NE(::mkdtemp(name), nullptr);
    std::filesystem::create_directories(std::string(name) + "/run/veltrad");
    return name;
  }
  std::string errorOf(const platform::Root& where, std::optional<int> handedOver = std::nullopt) {
    const auto opened = ipc::openServiceSocket(where, handedOver);
    return opened ? "" : opened.error();
  }
  const platform::Root root;
};

TEST_F(ServiceSocketTest, IsOpenToEverybodyAndGoesWithItsMaker) {
  {
    auto opened = ipc::openServiceSocket(root, std::nullopt);
    ASSERT_TRUE(opened) << opened.error();
    struct stat found {};
    ASSERT_EQ(::stat(root.socketPath().c_str(), &found), 0);
    EXPECT_EQ(found.st_mode & 0777, 0666u);
    EXPECT_EQ(::fcntl(opened.value().listening(), F_GETFD), FD_CLOEXEC);
    EXPECT_NE(::fcntl(opened.value().listening(), F_GETFL) & O_NONBLOCK, 0);
    EXPECT_EQ(errorOf(root), "The daemon is already running: process " + std::to_string(::getpid()) +
                                 " holds " + root.lockPath() +
                                 ". Stop it first, or give this one a root of its own in VELTRA_ROOT.");
    EXPECT_EQ(::stat(root.socketPath().c_str(), &found), 0) << "the second daemon must not touch it";
  }
  EXPECT_FALSE(std::filesystem::exists(root.socketPath()));
  EXPECT_EQ(errorOf(root), "");
}

TEST_F(ServiceSocketTest, TakesThePlaceOfAStaleSocketAndOfNothingElse) {
  {
    platform::FileDescriptor stale(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, root.socketPath().c_str(), sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(stale.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  }
  EXPECT_EQ(errorOf(root), "");
  std::ofstream(root.socketPath()) << "something precious";
  EXPECT_EQ(errorOf(root),
            root.socketPath() + " is no socket, but the daemon's socket belongs there: remove it.");
  EXPECT_TRUE(std::filesystem::exists(root.socketPath()));
  const platform::Root missing(root.directory() + "/missing");
  EXPECT_EQ(errorOf(missing),
            "The lock " + missing.lockPath() + " cannot be opened: No such file or directory.");
  const platform::Root deep(root.directory() + "/" + std::string(100, 'd'));
  std::filesystem::create_directories(deep.runDirectory());
  EXPECT_NE(errorOf(deep).find("and a socket address holds 107: choose a shorter root."), std::string::npos)
      << errorOf(deep);
}

TEST_F(ServiceSocketTest, UsesASocketThatWasHandedOverAndLeavesItsFile) {
  const std::string path = root.directory() + "/activated.sock";
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  const int given = ::socket(AF_UNIX, SOCK_STREAM, 0);
  ASSERT_EQ(::bind(given, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  EXPECT_NE(errorOf(root, ::dup(given)).find("does not listen"), std::string::npos);
  ASSERT_EQ(::listen(given, 5), 0);
  {
    auto opened = ipc::openServiceSocket(root, given);
    ASSERT_TRUE(opened) << opened.error();
    EXPECT_EQ(opened.value().listening(), given);
    EXPECT_FALSE(std::filesystem::exists(root.socketPath()));
  }
  EXPECT_TRUE(std::filesystem::exists(path));
  int ends[2];
  ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
  EXPECT_NE(errorOf(root, ends[0]).find("is no Unix stream socket"), std::string::npos);
  ::close(ends[1]);
}

}  // namespace
}  // namespace veltrad::ipc_test
