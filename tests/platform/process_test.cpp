// The process's own services: run loop, sandbox, service manager, counters, draws.
#include <arpa/inet.h>
#include <dirent.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <set>
#include <thread>

#include "base/json.h"
#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "fakes/temporary_directory.h"
#include "platform/child_process.h"
#include "platform/clock.h"
#include "platform/counters.h"
#include "platform/landlock.h"
#include "platform/random.h"
#include "platform/root.h"
#include "platform/run_loop.h"
#include "platform/sandbox.h"
#include "platform/service_manager.h"
#include "platform/transaction.h"
#include "platform/uuid.h"

namespace veltrad::platform {
namespace {

using namespace std::chrono_literals;

// ---- run loop

TEST(RunLoop, ASignalEndsItAndASecondOneTheProcess) {
  for (const int first : {SIGTERM, SIGINT}) {
    fakes::ChildProcess child([](const auto& say) {
      RunLoop loop;
      loop.blockSignals();
      int ticks = 0;
      const int signal = loop.run(1ms, [&] {
        if (++ticks == 1) say("running");
      });
      say("returned " + std::to_string(signal));
      while (true) ::pause();
      return 0;
    });
    ASSERT_EQ(child.nextLine(), "running");
    child.send(SIGHUP);   // asks for nothing
    child.send(SIGPIPE);  // is ignored
    child.send(first);
    EXPECT_EQ(child.nextLine(), "returned " + std::to_string(first));
    child.send(SIGTERM);
    EXPECT_EQ(child.wait(), 1);
  }
}

TEST(RunLoop, StopFromAnotherThreadReturnsZeroAfterTicks) {
  fakes::ChildProcess child([](const auto& say) {
    RunLoop loop;
    loop.blockSignals();
    std::thread stopper;
    int ticks = 0;
    const int signal = loop.run(1ms, [&] {
      if (++ticks == 3) stopper = std::thread([&] { loop.stop(); });
    });
    stopper.join();
    say(std::to_string(signal) + (ticks >= 3 ? " ticked" : " early"));
    return 0;
  });
  EXPECT_EQ(child.nextLine(), "0 ticked");
  EXPECT_EQ(child.wait(), 0);
}

// ---- sandbox

int errorOf(bool ok) {
  return ok ? 0 : errno;
}

int opening(const std::string& path, int flags) {
  const FileDescriptor file(::open(path.c_str(), flags | O_CLOEXEC, 0600));
  return errorOf(file.isOpen());
}

class SandboxTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ::unsetenv("VELTRA_SANDBOX");
    for (const char* name : {"readable", "writable", "other", "writable/below"})
      ASSERT_EQ(::mkdir(path(name).c_str(), 0755), 0);
    for (const char* name : {"readable/x", "other/x", "writable/x", "file"}) _directory.write(name, "x");
    _profile = {
        "test", {path("readable"), path("file"), path("missing"), "/usr/lib", "/proc"}, {path("writable")}};
  }
  std::string path(std::string_view name) const { return _directory.path(name); }

  fakes::TemporaryDirectory _directory;
  SandboxProfile _profile;
};

TEST_F(SandboxTest, LeavesWhatTheProfileNamesAndTheNetwork) {
  if (landlock::abi() == 0) GTEST_SKIP() << "this kernel has no Landlock";
  fakes::ChildProcess child([&](const auto& say) {
    const auto expect = [&](const char* what, int error, int expected) {
      if (error != expected) say(std::string(what) + ": " + ::strerror(error));
    };
    const auto entered = enterSandbox(_profile);
    if (!entered || !entered.value().inForce) {
      say(entered ? entered.value().line : entered.error());
      return 1;
    }
    expect("read a tree", opening(path("readable/x"), O_RDONLY), 0);
    expect("list a tree", opening(path("readable"), O_RDONLY | O_DIRECTORY), 0);
    expect("read a lone file", opening(path("file"), O_RDONLY), 0);
    expect("write where reading is allowed", opening(path("readable/x"), O_WRONLY), EACCES);
    expect("write a lone file", opening(path("file"), O_WRONLY), EACCES);
    expect("make where reading is allowed", opening(path("readable/new"), O_WRONLY | O_CREAT), EACCES);
    expect("read elsewhere", opening(path("other/x"), O_RDONLY), EACCES);
    expect("make elsewhere", opening(path("other/new"), O_WRONLY | O_CREAT), EACCES);
    expect("remove elsewhere", errorOf(::unlink(path("other/x").c_str()) == 0), EACCES);
    expect("make", opening(path("writable/new"), O_RDWR | O_CREAT | O_EXCL), 0);
    expect("truncate", opening(path("writable/x"), O_WRONLY | O_TRUNC), 0);
    expect("rename", errorOf(::rename(path("writable/new").c_str(), path("writable/x").c_str()) == 0), 0);
    expect("rename across",
           errorOf(::rename(path("writable/x").c_str(), path("writable/below/x").c_str()) == 0), EXDEV);
    expect("make a directory", errorOf(::mkdir(path("writable/d").c_str(), 0755) == 0), 0);
    expect("remove a directory", errorOf(::rmdir(path("writable/d").c_str()) == 0), 0);
    expect("make a link", errorOf(::symlink("/", path("writable/l").c_str()) == 0), EACCES);
    sockaddr_un address{AF_UNIX, {}};
    path("writable/s").copy(address.sun_path, sizeof address.sun_path - 1);
    const FileDescriptor local(::socket(AF_UNIX, SOCK_STREAM, 0));
    expect("bind a socket",
           errorOf(::bind(local.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) == 0), 0);
    expect("remove a socket", errorOf(::unlink(path("writable/s").c_str()) == 0), 0);
    sockaddr_in loopback{AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
    const FileDescriptor network(::socket(AF_INET, SOCK_STREAM, 0));
    expect("the network",
           errorOf(::bind(network.get(), reinterpret_cast<sockaddr*>(&loopback), sizeof loopback) == 0), 0);
    ::execl("/bin/true", "true", nullptr);
    expect("run a program", errno, EACCES);
    ::execl("/usr/lib/x86_64-linux-gnu/ld-linux-x86-64.so.2", "ld", nullptr);
    expect("run a program from a readable tree", errno, EACCES);
    expect("no new privileges", ::prctl(PR_GET_NO_NEW_PRIVS, 0, 0, 0, 0), 1);
    int later = 0;
    std::thread([&] { later = opening(path("other/x"), O_RDONLY); }).join();
    expect("a thread that starts later", later, EACCES);
    say(entered.value().line);
    return 0;
  });
  EXPECT_EQ(
      child.rest(),
      "Sandbox \"test\" in force: Landlock ABI " + std::to_string(landlock::abi()) +
          ", 4 paths to read, 1 to write, 1 missing and left out; no program runs, no new privileges\n");
  EXPECT_EQ(child.wait(), 0);
}

TEST_F(SandboxTest, RequiredIsFatalWhereTheKernelCannotAndAnUnknownChoiceEverywhere) {
  fakes::ChildProcess child([&](const auto& say) {
    ::setenv("VELTRA_SANDBOX", "maybe", 1);
    const auto unknown = enterSandbox(_profile);
    say(unknown ? "entered" : unknown.error());
    ::setenv("VELTRA_SANDBOX", "required", 1);
    const auto required = enterSandbox(_profile);
    say(required && required.value().inForce ? "in force" : required ? "without" : "refused");
    return 0;
  });
  EXPECT_EQ(child.nextLine(), "VELTRA_SANDBOX is \"maybe\": expected required, or nothing");
  EXPECT_EQ(child.nextLine(), landlock::abi() > 0 ? "in force" : "refused");
}

TEST(SandboxProfile, KeepsTheHostsFilesOutsideTheRoot) {
  const SandboxProfile profile = veltradSandboxProfile(Root("/r/"));
  EXPECT_EQ(profile.name, "com.florn.veltrad");
  const std::set<std::string> read(profile.read.begin(), profile.read.end());
  for (const char* path : {"/r/etc/veltrad", "/r/usr/share/veltra", "/etc", "/proc", "/usr/share/zoneinfo"}) {
    EXPECT_TRUE(read.count(path)) << path;
  }
  const std::vector<std::string> write{"/r/var/lib/veltrad/preferences", "/r/var/log/veltrad",
                                       "/r/run/veltrad", "/r/var/mobile/Library/Logs/Zentrel"};
  EXPECT_EQ(profile.write, write);
}

// ---- service manager

class ServiceManagerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    sockaddr_un address{AF_UNIX, {}};
    _directory.path("notify").copy(address.sun_path, sizeof address.sun_path - 1);
    _socket.reset(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    ASSERT_EQ(::bind(_socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    ::setenv("NOTIFY_SOCKET", address.sun_path, 1);
  }
  void TearDown() override { ::unsetenv("NOTIFY_SOCKET"); }
  std::string told() const {
    char buffer[512];
    const ssize_t got = ::recv(_socket.get(), buffer, sizeof buffer, 0);
    return got > 0 ? std::string(buffer, static_cast<std::size_t>(got)) : "";
  }

  fakes::TemporaryDirectory _directory;
  FileDescriptor _socket;
  ServiceManager _manager;
};

TEST_F(ServiceManagerTest, IsToldWhatHappens) {
  _manager.ready();
  EXPECT_EQ(told(), "READY=1");
  _manager.status("one\nREADY=1");
  EXPECT_EQ(told(), "STATUS=one READY=1");
  _manager.feedWatchdog();
  EXPECT_EQ(told(), "WATCHDOG=1");
  _manager.stopping();
  EXPECT_EQ(told(), "STOPPING=1");
  ServiceTransaction transaction(_manager);
  transaction.open();
  EXPECT_EQ(told(), "STATUS=Serving sessions");
  transaction.close();
  EXPECT_EQ(told(), "STATUS=Idle: no sessions");
}

TEST(ServiceTransactionDeathTest, MustAlternate) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  ServiceManager manager;
  EXPECT_DEATH(
      {
        ServiceTransaction transaction(manager);
        transaction.close();
      },
      "");
  EXPECT_DEATH(
      {
        ServiceTransaction transaction(manager);
        transaction.open();
        transaction.open();
      },
      "");
}

TEST(ServiceManager, WantsAWatchdogOfThisProcessAlone) {
  const ServiceManager manager;
  EXPECT_FALSE(manager.watchdogInterval());
  ::setenv("WATCHDOG_USEC", "3000000", 1);
  EXPECT_EQ(manager.watchdogInterval(), 1'500ms);
  ::setenv("WATCHDOG_PID", "1", 1);
  EXPECT_FALSE(manager.watchdogInterval());
  ::unsetenv("WATCHDOG_USEC");
  ::unsetenv("WATCHDOG_PID");
}

int listeningSocket(const std::string& path, int type) {
  sockaddr_un address{AF_UNIX, {}};
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  const int socket = ::socket(AF_UNIX, type, 0);
  ::bind(socket, reinterpret_cast<sockaddr*>(&address), sizeof address);
  if (type == SOCK_STREAM) ::listen(socket, 1);
  return socket;
}

TEST(ServiceManager, TakesOneListeningSocketAndNothingElse) {
  const struct {
    int count;
    int type;
    const char* verdict;
  } cases[] = {
      {0, SOCK_STREAM, "none"},
      {1, SOCK_STREAM, "3 close-on-exec"},
      {1, SOCK_DGRAM, "the handed-over descriptor is no listening Unix stream socket"},
      {2, SOCK_STREAM, "expected one handed-over socket, got 2"},
  };
  for (const auto& c : cases) {
    fakes::TemporaryDirectory directory;
    fakes::ChildProcess child([&](const auto& say) {
      // The saying end of the pipe may be descriptor 3 or 4 itself: the verdict is said through a copy made
      // first.
      const FileDescriptor first(listeningSocket(directory.path("a"), c.type));
      const FileDescriptor second(listeningSocket(directory.path("b"), c.type));
      const int out = ::fcntl(first.get(), F_DUPFD, 100);
      const int other = ::fcntl(second.get(), F_DUPFD, 100);
      ServiceManager manager;
      Result<std::optional<int>, std::string> taken = std::optional<int>();
      {
        const int savedThird = ::fcntl(3, F_DUPFD, 200);
        const int savedFourth = ::fcntl(4, F_DUPFD, 200);
        ::dup2(out, 3);
        ::dup2(other, 4);
        if (c.count > 0) {
          ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
          ::setenv("LISTEN_FDS", std::to_string(c.count).c_str(), 1);
        }
        taken = manager.handedOverSocket();
        const bool closes = (::fcntl(3, F_GETFD) & FD_CLOEXEC) != 0;
        if (taken && taken.value() && !closes) taken = Failure{std::string("left open on exec")};
        ::dup2(savedThird, 3);
        ::dup2(savedFourth, 4);
      }
      if (!taken) say(taken.error());
      if (taken) say(taken.value() ? std::to_string(*taken.value()) + " close-on-exec" : "none");
      return 0;
    });
    EXPECT_EQ(child.nextLine(), c.verdict);
  }
}

// ---- counters, clock, draws, names

TEST(Counters, AreWrittenWhenTheyChangedAndAgainAfterAFailure) {
  fakes::RecordedLog log;
  fakes::FakeFileStore files;
  Counters counters;
  counters.count("message dropped: the queue is full");
  counters.count("message dropped: the queue is full", 41);
  counters.count("nothing", 0);
  EXPECT_EQ(counters.value("message dropped: the queue is full"), 42u);
  EXPECT_EQ(counters.value("nothing"), 0u);

  files.failWrites(FileFailure::Kind::noSpace);
  log.expectLine(LogLevel::error, "The counters could not be written: /run/c: No space left on device");
  counters.writeIfChanged(files, "/run/c", 5);
  counters.writeIfChanged(files, "/run/c", 5);
  files.failWrites({});
  counters.writeIfChanged(files, "/run/c", 1'700'000'000.5);
  counters.writeIfChanged(files, "/run/c", 1'700'000'000.5);
  EXPECT_EQ(files.replaced(), 1);
  EXPECT_EQ(files.mode("/run/c"), 0644u);
  const auto written = parseJSON(*files.bytes("/run/c"));
  ASSERT_TRUE(written);
  const Dictionary expected{{"pid", static_cast<int>(::getpid())},
                            {"started", 1'700'000'000.5},
                            {"counts", Dictionary{{"message dropped: the queue is full", 42}}}};
  EXPECT_EQ(written.value(), Value(expected));
}

TEST(UnseededSequence, IsTheLinearCongruentialOneFromZero) {
  UnseededSequence random;
  std::uint64_t state = 0;
  for (int i = 0; i < 1'000; ++i) {
    state = (state * 0x5'DEEC'E66D + 0xB) & ((1ull << 48) - 1);
    ASSERT_EQ(random.uniform(), static_cast<double>(state) / static_cast<double>(1ull << 48)) << i;
  }
}

TEST(UUID, IsRandomVersionFourInUpperCase) {
  const std::string text = randomUUIDText();
  ASSERT_EQ(text.size(), 36u);
  for (std::size_t i = 0; i < text.size(); ++i) {
    const bool dash = i == 8 || i == 13 || i == 18 || i == 23;
    EXPECT_EQ(text[i] == '-', dash) << text;
    if (!dash) EXPECT_NE(std::string("0123456789ABCDEF").find(text[i]), std::string::npos) << text;
  }
  EXPECT_EQ(text[14], '4');
  EXPECT_NE(std::string("89AB").find(text[19]), std::string::npos);
  EXPECT_NE(randomUUIDText(), text);
}

TEST(Root, PutsEveryPathBelow) {
  EXPECT_EQ(Root("/").path("etc/x"), "/etc/x");
  EXPECT_EQ(Root("/r//").path("etc/x"), "/r/etc/x");
  EXPECT_EQ(Root("r").socketPath(), "r/run/veltrad/com.florn.veltrad.sock");
  ::setenv("VELTRA_ROOT", "", 1);
  EXPECT_EQ(Root::fromEnvironment().directory(), "/");
  ::setenv("VELTRA_ROOT", "/r", 1);
  EXPECT_EQ(Root::fromEnvironment().directory(), "/r");
  ::unsetenv("VELTRA_ROOT");
}

}  // namespace
}  // namespace veltrad::platform
