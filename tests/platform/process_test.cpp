// SPDX-License-Identifier: Apache-2.0
// What the sandbox lets the process do.
#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <cerrno>
#include <thread>

#include "fakes/unix_socket.h"
#include "platform/child_process.h"
#include "platform/landlock.h"
#include "platform/sandbox.h"

namespace veltrad::platform {
namespace {

int errorOf(int result) {
  return result >= 0 ? 0 : errno;
}

TEST(Sandbox, LeavesWhatTheProfileNamesAndTheNetwork) {
  if (landlock::abi() == 0) GTEST_SKIP() << "this kernel has no Landlock";
  const TemporaryDirectory directory;
  const auto path = [&](std::string_view name) { return directory.path(name); };
  for (const char* name : {"r", "w", "w/below", "other"}) std::filesystem::create_directory(path(name));
  for (const char* name : {"r/x", "w/x", "other/x", "file"}) directory.write(name, "x");
  const platform::SandboxProfile profile{
      "test", {path("r"), path("file"), path("missing"), "/usr/lib", "/proc"}, {path("w")}};
  const ChildProcess child([&](const auto& say) {
    const auto expect = [&](const char* what, int error, int expected) {
      if (error != expected) say(std::string(what) + ": " + ::strerror(error));
    };
    const auto opening = [&](const char* name, int flags) {
      return errorOf(::open(path(name).c_str(), flags, 0600));
    };
    ::unsetenv("VELTRA_SANDBOX");
    const auto entered = platform::enterSandbox(profile);
    say(entered ? entered.value().line : entered.error());
    expect("read a tree", opening("r/x", O_RDONLY), 0);
    expect("list a tree", opening("r", O_RDONLY | O_DIRECTORY), 0);
    expect("read a lone file", opening("file", O_RDONLY), 0);
    expect("write where reading is allowed", opening("r/x", O_WRONLY), EACCES);
    expect("write a lone file", opening("file", O_WRONLY), EACCES);
    expect("make where reading is allowed", opening("r/new", O_WRONLY | O_CREAT), EACCES);
    expect("read elsewhere", opening("other/x", O_RDONLY), EACCES);
    expect("remove elsewhere", errorOf(::unlink(path("other/x").c_str())), EACCES);
    expect("make", opening("w/new", O_RDWR | O_CREAT | O_EXCL), 0);
    expect("truncate", opening("w/x", O_WRONLY | O_TRUNC), 0);
    expect("rename", errorOf(::rename(path("w/new").c_str(), path("w/x").c_str())), 0);
    expect("rename across", errorOf(::rename(path("w/x").c_str(), path("w/below/x").c_str())), EXDEV);
    expect("make a directory", errorOf(::mkdir(path("w/d").c_str(), 0755)), 0);
    expect("remove a directory", errorOf(::rmdir(path("w/d").c_str())), 0);
    expect("make a link", errorOf(::symlink("/", path("w/l").c_str())), EACCES);
    unixSocket(::bind, path("w/s"));
    expect("a bound socket", errorOf(::access(path("w/s").c_str(), F_OK)), 0);
    expect("remove a socket", errorOf(::unlink(path("w/s").c_str())), 0);
    const sockaddr_in any{AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
    const int network = ::socket(AF_INET, SOCK_STREAM, 0);
    expect("the network", errorOf(::bind(network, reinterpret_cast<const sockaddr*>(&any), sizeof any)), 0);
    expect("run a program", errorOf(::execl("/bin/true", "true", nullptr)), EACCES);
    expect("no new privileges", ::prctl(PR_GET_NO_NEW_PRIVS, 0, 0, 0, 0), 1);
    std::thread([&] { expect("a thread that starts later", opening("other/x", O_RDONLY), EACCES); }).join();
  });
  EXPECT_EQ(child.said, "Sandbox \"test\" in force: Landlock ABI " + std::to_string(landlock::abi()) +
                            ", 4 paths to read, 1 to write, 1 missing and left out; no program runs, no new "
                            "privileges\n");
}

TEST(Sandbox, RequiredIsFatalWhereTheKernelCannotAndAnUnknownChoiceEverywhere) {
  const ChildProcess child([&](const auto& say) {
    for (const char* choice : {"maybe", "required"}) {
      ::setenv("VELTRA_SANDBOX", choice, 1);
      const auto entered = platform::enterSandbox({"test", {"/usr/lib"}, {}});
      say(entered ? entered.value().inForce ? "in force" : "without" : entered.error().substr(0, 24));
    }
  });
  EXPECT_THAT(child.said, ::testing::StartsWith("VELTRA_SANDBOX is \"maybe\n"));
  EXPECT_EQ(child.said.ends_with("\nin force\n"), landlock::abi() > 0);
  EXPECT_EQ(child.said.find("without"), std::string::npos);
}

}  // namespace
}  // namespace veltrad::platform
