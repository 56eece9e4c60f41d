// veltra-lab: the servers of the system for development and tests. The main thread waits for the signal to
// stop.
#include <CLI/CLI.hpp>

#include <unistd.h>
#include <csignal>
#include <cstdio>

#include "directory.h"
#include "formats/json.h"
#include "server.h"

namespace {

using veltrad::lab::Directory;
using veltrad::lab::Server;

constexpr const char* kAbout =
    "Plays the servers of the system on the loopback: over HTTPS storebags, signed, the event collector, log "
    "data\nand uploads; over UDP the dashboard, with acknowledgements.\n"
    "Prints one JSON line when it serves; writes what arrives to DIR/received; ends on SIGTERM or SIGINT.\n\n"
    "  GET    /storebags/maple/NAME   DIR/storebags/NAME.plist or .json, signed; ${url} in its texts is this "
    "server,\n"
    "                                 the text ${dashboardPort} the dashboard's port as a number\n"
    "  POST   /logdata                log data, answered with the place where it is stored\n"
    "  POST   /upload                 a file, gzipped, answered {\"success\": true}\n"
    "  POST   /events, /realtime, …   the event collector\n"
    "  POST   /control                misbehave as the JSON object in the body says; DELETE: behave again\n"
    "  GET    /received?kind=events   what arrived, one JSON object a line; also storebags, dashboard, "
    "logdata, "
    "uploads\n"
    "  GET    /                       a page with the newest arrivals\n\n"
    "Misbehaviour: path (a prefix), times, share (in a hundred), status, delayMs, dripMs (between the bytes "
    "of\n"
    "the body), cut, cutHalfway, stall, endless, sign (wrong, missing, none), lastModified, headers, body "
    "(a\n"
    "text or {\"$data\": base64}). A redirect is a status and a header:\n"
    "  {\"path\": \"/events\", \"status\": 302, \"headers\": {\"Location\": \"/there\"}}\n"
    "Datagrams have the path /dashboard; times, share and delayMs are for them too, and ack, how they are\n"
    "acknowledged: drop, duplicate, reorder (behind the next one), short, long, foreign (another event\n"
    "number), stranger (from another port):\n"
    "  {\"path\": \"/dashboard\", \"share\": 30, \"ack\": \"drop\"}";

int fail(const std::string& why) {
  std::fprintf(stderr, "veltra-lab: %s\n", why.c_str());
  return 1;
}

// Before any other thread, so that all of them leave the signals to sigwait.
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
  app.add_option("--dir", path, "what the lab keeps: certificate, keys, storebags, received")
      ->capture_default_str();
  app.add_option("--port", port, "0: any that is free")->check(CLI::Range(0, 65'535))->capture_default_str();
  app.add_option("--dashboard-port", dashboardPort, "UDP, on 127.0.0.1; 0: any that is free [as --port]")
      ->check(CLI::Range(0, 65'535));
  app.add_option("--max-age", maxAge, "seconds that storebags say they are fresh")
      ->check(CLI::Range(0, 2'147'483'647))
      ->capture_default_str();
  app.add_option("--misbehave", rules,
                 "a rule as JSON, for instance '{\"path\": \"/events\", \"status\": 503}'");
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? 0 : 2;
  }
  const auto directory = Directory::open(path);
  if (!directory) return fail(directory.error());
  return serve(directory.value(), port, dashboardPort.value_or(port), maxAge, rules);
}
