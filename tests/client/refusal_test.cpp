// Every way in which a session cannot be made has one line that says what to do.
#include <fstream>

#include "sessions.h"

namespace veltrad::test {
namespace {

TEST(Refusal, NamesWhatStandsAtTheSocketsPlace) {
  struct Case {
    const char* name;
    std::function<int(const std::string& path)> prepare;  // a descriptor to keep open, or -1
    veltra_status status;
    const char* text;  // @ stands for the path
  };
  const Case cases[] = {
      {"nothing", [](const std::string&) { return -1; }, VELTRA_NO_DAEMON,
       "No daemon listens on @: start veltrad, or name its root with VELTRA_ROOT or --root."},
      {"a stale socket",
       [](const std::string& path) {
         ::close(boundSocket(path, SOCK_STREAM, true));
         return -1;
       },
       VELTRA_NO_DAEMON, "The daemon that made @ has ended: start veltrad again."},
      {"a file",
       [](const std::string& path) {
         std::ofstream(path) << "no socket";
         return -1;
       },
       VELTRA_NO_DAEMON,
       "@ is a regular file, not the daemon's socket: remove it and start veltrad, or name another root with "
       "VELTRA_ROOT or --root."},
      {"a directory",
       [](const std::string& path) {
         std::filesystem::create_directory(path);
         return -1;
       },
       VELTRA_NO_DAEMON,
       "@ is a directory, not the daemon's socket: remove it and start veltrad, or name another root with "
       "VELTRA_ROOT or --root."},
      {"a datagram socket", [](const std::string& path) { return boundSocket(path, SOCK_DGRAM, false); },
       VELTRA_NO_DAEMON, "@ is a socket of another type, not the daemon's: remove it and start veltrad."},
  };
  for (const Case& each : cases) {
    SCOPED_TRACE(each.name);
    TemporaryRoot root;
    const int kept = each.prepare(root.socketPath());
    const Refusal refusal = refused(optionsFor(root.path()));
    EXPECT_EQ(refusal.status, each.status);
    std::string expected = each.text;
    expected.replace(expected.find('@'), 1, root.socketPath());
    EXPECT_EQ(refusal.text, expected);
    if (kept >= 0) ::close(kept);
  }
}

TEST(Refusal, NamesARootThatIsTooLongAndOptionsThatWereNotSetUp) {
  const std::string root = "/" + std::string(200, 'r');
  const Refusal refusal = refused(optionsFor(root));
  EXPECT_EQ(refusal.status, VELTRA_INVALID);
  EXPECT_EQ(refusal.text,
            "The root is too long: the socket's path " + root +
                "/run/veltrad/com.florn.veltrad.sock has 236 bytes, and at most 107 are possible; name "
                "a shorter root with VELTRA_ROOT or --root.");
  EXPECT_EQ(refused(veltra_session_options{}).status, VELTRA_INVALID);
}

TEST(Refusal, TellsWhatTheDaemonSaidInPlaceOfAHello) {
  using ipc::FrameKind;
  struct Case {
    const char* name;
    std::string frame;
    veltra_status status;
    const char* text;
  };
  const Case cases[] = {
      {"a refusal",
       ipc::makeFrame(
           FrameKind::refusal, 0,
           Dictionary{{"error", Dictionary{{"domain", "d"}, {"code", -1}, {"description", "Not you."}}}}),
       VELTRA_REFUSED, "Not you."},
      {"a refusal without a reason", ipc::makeFrame(FrameKind::refusal, 0, Dictionary{}), VELTRA_REFUSED,
       "The daemon on @ refused the connection and gave no reason."},
      {"another wire", ipc::makeFrame(FrameKind::hello, 0, Dictionary{{"wire", 2}}), VELTRA_REFUSED,
       "The daemon on @ speaks version 2 of the wire protocol and this library 1: install both from the same "
       "release."},
      {"no hello", ipc::makeFrame(FrameKind::event, 0, Dictionary{{"wire", 1}}), VELTRA_NO_DAEMON,
       "What listens on @ does not answer like veltrad: stop it and start veltrad."},
      {"another protocol", "HTTP/1.1 400 Bad Request\r\n\r\n", VELTRA_NO_DAEMON,
       "What listens on @ does not answer like veltrad: stop it and start veltrad."},
      {"the end", "", VELTRA_NO_DAEMON,
       "The daemon on @ ended the connection without a word: start veltrad again, or see its log."},
  };
  for (const Case& each : cases) {
    SCOPED_TRACE(each.name);
    FakeDaemon daemon([&](Link& link) { link.send(each.frame); });
    const Refusal refusal = refused(optionsFor(daemon.root()));
    EXPECT_EQ(refusal.status, each.status);
    std::string expected = each.text;
    if (const auto at = expected.find('@'); at != std::string::npos)
      expected.replace(at, 1, daemon.socketPath());
    EXPECT_EQ(refusal.text, expected);
  }
}

TEST(Refusal, WaitsFiveSecondsForAHello) {
  FakeDaemon daemon([](Link& link) {
    while (link.nextCall()) continue;
    Dictionary hello;
    while (link.nextFrame(hello)) continue;
  });
  const auto begun = std::chrono::steady_clock::now();
  const Refusal refusal = refused(optionsFor(daemon.root()));
  EXPECT_GE(std::chrono::steady_clock::now() - begun, std::chrono::milliseconds(4900));
  EXPECT_EQ(refusal.status, VELTRA_NO_DAEMON);
  EXPECT_EQ(refusal.text, "The daemon on " + daemon.socketPath() +
                              " gave no answer within 5 s: see whether it is stuck or overloaded.");
}

}  // namespace
}  // namespace veltrad::test
