// veltra-lab: the servers of the system for development and tests.
#include <CLI/CLI.hpp>

#include <unistd.h>
#include <csignal>
#include <cstdio>

#include "base/version.h"
#include "directory.h"
#include "formats/json.h"
#include "platform/service_manager.h"
#include "server.h"

namespace {

using veltrad::lab::Directory;
using veltrad::lab::Server;

constexpr const char* kAbout =
    R"(Plays the servers of the system on the loopback interface. HTTPS: signed storebags, the event collector,
log data and uploads. UDP: the dashboard, with acknowledgements.
Prints one JSON line when it is ready, writes what arrives to DIR/received, and ends on SIGTERM or SIGINT.

  GET    /storebags/maple/NAME   DIR/storebags/NAME.plist or .json, signed. In its texts ${url} is replaced by
                                 the address of this server; the text ${dashboardPort} becomes the dashboard's
                                 port as a number
  POST   /logdata                log data; the answer is the place where it is stored
  POST   /upload                 a gzipped file; the answer is {"success": true}
  POST   /events, /realtime, …   the event collector
  POST   /control                add a rule for misbehaviour: the body is JSON, see below. DELETE: remove all rules
  GET    /received?kind=events   what arrived, one JSON object per line. Also: storebags, dashboard, logdata, uploads
  GET    /                       a page with the newest arrivals

Keys of a rule: path (a prefix), times, share (per cent), status, delayMs, dripMs (pause between the bytes of
the body), cut, cutHalfway, stall, endless, sign (wrong, missing, none), lastModified, headers, body (a text or
{"$data": base64}). A redirect is a status and a header:
  {"path": "/events", "status": 302, "headers": {"Location": "/there"}}
For datagrams the path is /dashboard. They use times, share, delayMs and ack, which changes the acknowledgement:
drop, duplicate, reorder (send it after the next one), short, long, foreign (another event number), stranger
(from another port):
  {"path": "/dashboard", "share": 30, "ack": "drop"})";

int fail(const std::string& why) {
  std::fprintf(stderr, "veltra-lab: %s\n", why.c_str());
  return 1;
}

// Called before other threads start, so that only sigwait receives the signals.
sigset_t blockStopSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  return signals;
}

int serve(const Directory& directory, int port, int dashboardPort, int maxAge,
          const std::vector<std::string>& rules) {
  const sigset_t signals = blockStopSignals();
  Server server(directory, maxAge);
  for (const auto& text : rules) {
    auto rule = veltrad::lab::ruleFromJSON(text);
    if (!rule) return fail("--misbehave: " + rule.error());
    server.add(std::move(rule).value());
  }
  if (const auto why = server.start(port, dashboardPort)) return fail(*why);
  const veltrad::Dictionary line{{"url", server.url()},
                                 {"logDataURL", server.logDataURL()},
                                 {"uploadURL", server.uploadURL()},
                                 {"dashboardPort", server.dashboardPort()},
                                 {"certificate", directory.certificatePath()},
                                 {"publicKey", directory.publicKeyPath()},
                                 {"pid", static_cast<long>(getpid())}};
  std::printf("%s\n", veltrad::formats::writeJSON(line).c_str());
  std::fflush(stdout);
  veltrad::platform::ServiceManager().ready();
  int signal = 0;
  sigwait(&signals, &signal);
  server.stop();
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  std::string path = "veltra-lab";
  int port = 8443;
  std::optional<int> dashboardPort;
  int maxAge = 86'400;
  std::vector<std::string> rules;
  CLI::App app{kAbout, "veltra-lab"};
  app.set_version_flag("--version", std::string("veltra-lab ") + veltrad::kVersion, "Print the version");
  app.add_option("--dir", path, "Directory for the certificate, keys, storebags and received data")
      ->capture_default_str();
  app.add_option("--port", port, "HTTPS port; 0: any free port")
      ->check(CLI::Range(0, 65'535))
      ->capture_default_str();
  app.add_option("--dashboard-port", dashboardPort, "UDP port on 127.0.0.1; 0: any free port [as --port]")
      ->check(CLI::Range(0, 65'535));
  app.add_option("--max-age", maxAge, "Seconds for which storebags stay fresh")
      ->check(CLI::Range(0, 2'147'483'647))
      ->capture_default_str();
  app.add_option("--misbehave", rules,
                 "A rule as JSON, for instance '{\"path\": \"/events\", \"status\": 503}'");
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? 0 : 2;
  }
  const auto directory = Directory::open(path);
  if (!directory) return fail(directory.error());
  return serve(directory.value(), port, dashboardPort.value_or(port), maxAge, rules);
}
