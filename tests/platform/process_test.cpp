// The process's own services: run loop, sandbox, service manager, counters, draws.
#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cerrno>
#include <thread>

#include "base/json.h"
#include "fakes/fake_file_store.h"
#include "fakes/recorded_log.h"
#include "fakes/temporary_directory.h"
#include "platform/child_process.h"
#include "platform/counters.h"
#include "platform/landlock.h"
#include "platform/random.h"
#include "platform/run_loop.h"
#include "platform/sandbox.h"
#include "platform/service_manager.h"
#include "platform/uuid.h"

namespace veltrad::platform {
namespace {

using namespace std::chrono_literals;

TEST(RunLoop, GoesOnUntilItIsAskedToEnd) {
  for (const int signal : {SIGTERM, SIGINT, 0}) {
    const ChildProcess child([&](const auto& say) {
      RunLoop loop;
      loop.blockSignals();
      std::thread stopper;
      int ticks = 0;
      const int ended = loop.run(1ms, [&] {
        if (++ticks == 1) ::kill(::getpid(), SIGHUP), ::kill(::getpid(), SIGPIPE);
        if (ticks == 3 && signal) ::kill(::getpid(), signal);
        if (ticks == 3 && !signal) stopper = std::thread([&] { loop.stop(); });
      });
      if (stopper.joinable()) stopper.join();
      say(std::to_string(ended) + (ticks >= 3 ? "" : " early"));
    });
    EXPECT_EQ(child.said, std::to_string(signal) + "\n");
  }
}

// ---- sandbox

int errorOf(int result) {
  return result >= 0 ? 0 : errno;
}

TEST(Sandbox, LeavesWhatTheProfileNamesAndTheNetwork) {
  if (landlock::abi() == 0) GTEST_SKIP() << "this kernel has no Landlock";
  const TemporaryDirectory directory;
  const auto path = [&](std::string_view name) { return directory.path(name); };
  for (const char* name : {"r", "w", "w/below", "other"}) std::filesystem::create_directory(path(name));
  for (const char* name : {"r/x", "w/x", "other/x", "file"}) directory.write(name, "x");
  const SandboxProfile profile{
      "test", {path("r"), path("file"), path("missing"), "/usr/lib", "/proc"}, {path("w")}};
  const ChildProcess child([&](const auto& say) {
    const auto expect = [&](const char* what, int error, int expected) {
      if (error != expected) say(std::string(what) + ": " + ::strerror(error));
    };
    const auto opening = [&](const char* name, int flags) {
      return errorOf(::open(path(name).c_str(), flags, 0600));
    };
    ::unsetenv("VELTRA_SANDBOX");
    const auto entered = enterSandbox(profile);
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
    sockaddr_un local{AF_UNIX, {}};
    path("w/s").copy(local.sun_path, sizeof local.sun_path - 1);
    const auto binding = [](int family, auto& address) {
      const int socket = ::socket(family, SOCK_STREAM, 0);
      return errorOf(::bind(socket, reinterpret_cast<sockaddr*>(&address), sizeof address));
    };
    expect("bind a socket", binding(AF_UNIX, local), 0);
    expect("remove a socket", errorOf(::unlink(local.sun_path)), 0);
    sockaddr_in any{AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
    expect("the network", binding(AF_INET, any), 0);
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
      const auto entered = enterSandbox({"test", {"/usr/lib"}, {}});
      say(entered ? entered.value().inForce ? "in force" : "without" : entered.error().substr(0, 24));
    }
  });
  EXPECT_THAT(child.said, ::testing::StartsWith("VELTRA_SANDBOX is \"maybe\n"));
  EXPECT_EQ(child.said.ends_with("\nin force\n"), landlock::abi() > 0);
  EXPECT_EQ(child.said.find("without"), std::string::npos);
}

// ---- service manager

int boundSocket(const std::string& path, int type) {
  sockaddr_un address{AF_UNIX, {}};
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  const int socket = ::socket(AF_UNIX, type | SOCK_NONBLOCK, 0);
  EXPECT_EQ(::bind(socket, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  if (type == SOCK_STREAM) ::listen(socket, 1);
  return socket;
}

TEST(ServiceManager, TakesOneListeningSocketAndNothingElse) {
  const struct {
    const char* count;
    int type;
    const char* verdict;
  } cases[] = {{nullptr, SOCK_STREAM, "none\n"},
               {"1", SOCK_STREAM, "3 close-on-exec\n"},
               {"1", SOCK_DGRAM, "the handed-over descriptor is no listening Unix stream socket\n"},
               {"2", SOCK_STREAM, "expected one handed-over socket, got 2\n"}};
  for (const auto& c : cases) {
    const TemporaryDirectory directory;
    const ChildProcess child([&](const auto& say) {
      const int socket = boundSocket(directory.path("s"), c.type);
      for (const int handed : {3, 4}) ::dup2(socket, handed);
      ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
      if (c.count) ::setenv("LISTEN_FDS", c.count, 1);
      const auto taken = ServiceManager().handedOverSocket();
      const bool closes = (::fcntl(3, F_GETFD) & FD_CLOEXEC) != 0;
      if (!taken) return say(taken.error());
      say(taken.value() ? std::to_string(*taken.value()) + (closes ? " close-on-exec" : "") : "none");
    });
    EXPECT_EQ(child.said, c.verdict);
  }
}

// ---- counters, draws, names

TEST(Counters, AreWrittenWhenTheyChangedAndAgainAfterAFailure) {
  RecordedLog log;
  FakeFileStore files;
  Counters counters;
  counters.count("message dropped: the queue is full", 42);
  counters.count("nothing", 0);
  files.failWrites(FileFailure::Kind::noSpace);
  log.expectLine(LogLevel::error, "The counters could not be written: /run/c: No space left on device");
  counters.writeIfChanged(files, "/run/c", 5);
  counters.writeIfChanged(files, "/run/c", 5);
  files.failWrites({});
  counters.writeIfChanged(files, "/run/c", 1'700'000'000.5);
  counters.writeIfChanged(files, "/run/c", 1'700'000'000.5);
  EXPECT_EQ(files.replaced(), 1);
  EXPECT_EQ(files.mode("/run/c"), 0644u);
  const Dictionary expected{{"pid", static_cast<int>(::getpid())},
                            {"started", 1'700'000'000.5},
                            {"counts", Dictionary{{"message dropped: the queue is full", 42}}}};
  EXPECT_EQ(parseJSON(files.bytes("/run/c").value_or("")).value(), Value(expected));
}

TEST(UnseededSequence, IsTheLinearCongruentialOneFromZero) {
  UnseededSequence random;
  std::uint64_t state = 0;
  for (int i = 0; i < 1'000; ++i) {
    state = (state * 0x5'DEEC'E66D + 0xB) & ((1ull << 48) - 1);
    ASSERT_EQ(random.uniform(), static_cast<double>(state) / 0x1p48) << i;
  }
}

TEST(UUID, IsRandomVersionFourInUpperCase) {
  const std::string text = randomUUIDText();
  EXPECT_THAT(text,
              ::testing::MatchesRegex("[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}"));
  EXPECT_NE(randomUUIDText(), text);
}

}  // namespace
}  // namespace veltrad::platform
