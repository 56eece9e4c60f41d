// SPDX-License-Identifier: Apache-2.0
// The options and help texts.
#include "options.h"

#include <CLI/CLI.hpp>

#include "base/version.h"

namespace veltrad::lab {
namespace {

constexpr const char* kAbout =
    R"(Plays the servers of the system on the loopback interface. HTTPS: signed storebags, the event collector,
log data and uploads. UDP: the dashboard, with acknowledgements.
Prints one JSON line when it is ready, writes what arrives to DIR/received, and ends on SIGTERM or SIGINT.

  GET    /storebags/maple/NAME   DIR/storebags/NAME as it is, if that is there; else NAME.plist or .json, signed
                                 with both keys in DIR/signing. In its texts ${url} is replaced by the address
                                 of this server; the text ${dashboardPort} becomes the dashboard's port as a
                                 number
  POST   /logdata                log data; the answer is the place where it is stored
  POST   /upload                 a gzipped file; the answer is {"success": true}
  POST   /events, /realtime, …   the event collector
  POST   /control                add a rule for misbehaviour: the body is JSON, see below. DELETE: remove all rules
  GET    /received?kind=events   what arrived, one JSON object per line. Also: storebags, dashboard, logdata, uploads
  GET    /doubles                how often each X-VLT-Post-ID has come that has come more than once
  GET    /                       a page with the newest arrivals

Keys of a rule: path (a prefix), times, share (per cent), status, delayMs, dripMs (pause between the bytes of
the body), cut, cutHalfway, stall, endless, sign (wrong, missing, none), lastModified, headers, body (a text or
{"$data": base64}), forMs (how long it is applied), script (an array of rules without paths, applied in turn, each
to one request unless it has times or forMs). A redirect is a status and a header:
  {"path": "/events", "status": 302, "headers": {"Location": "/there"}}
  {"path": "/events", "script": [{"status": 429, "headers": {"Retry-After": "2"}}, {"cut": true, "forMs": 5000}]}
"bag" changes a storebag before it is signed, and its keys. It is an object of serial, expires, name, validFor
(seconds after the clock, instead of expires), clock (a date and time instead of now), key (whose RSA key signs),
ed25519 (an array: whose Ed25519 keys sign, too) and revoked (an array: whose keys, or fingerprints). Keys are
those in DIR/signing/NAME, as veltra-storebag keygen makes them, by their NAME; "signing" are those in DIR/signing:
  {"path": "/storebags", "bag": {"serial": 7, "validFor": 60, "key": "next", "ed25519": ["next"]}}
For datagrams the path is /dashboard. They use times, share, delayMs and ack, which changes the acknowledgement:
drop, duplicate, reorder (send it after the next one), short, long, foreign (another event number), stranger
(from another port):
  {"path": "/dashboard", "share": 30, "ack": "drop"})";

constexpr const char* kExamples =
    R"(Examples:
  veltra-lab --dir /tmp/lab                               the storebag is /tmp/lab/storebags/quindle.json
  veltra-lab --misbehave '{"path": "/events", "status": 503, "times": 3}'
  curl --cacert /tmp/lab/certificate.pem 'https://localhost:8443/received?kind=events'
  curl --cacert /tmp/lab/certificate.pem --data '{"path": "/events", "delayMs": 500}' https://localhost:8443/control)";

}  // namespace

void describe(CLI::App& app, Options& options) {
  app.name("veltra-lab");
  app.description(kAbout);
  tools::useManualStyle(app);
  app.footer(kExamples);
  app.set_version_flag("--version", std::string("veltra-lab ") + kVersion, "Print the version");
  app.add_option("--dir", options.path, "Directory for the certificate, keys, storebags and received data")
      ->type_name("DIR")
      ->capture_default_str();
  app.add_option("--port", options.port, "HTTPS port; 0: any free port")
      ->check(CLI::Range(0, 65'535))
      ->capture_default_str();
  app.add_option("--dashboard-port", options.dashboardPort,
                 "UDP port on 127.0.0.1; 0: any free port [as --port]")
      ->check(CLI::Range(0, 65'535));
  app.add_option("--max-age", options.maxAge, "Seconds for which storebags stay fresh")
      ->check(CLI::Range(0, 2'147'483'647))
      ->capture_default_str();
  app.add_option("--misbehave", options.rules, "A rule as JSON; repeat the option for more")
      ->type_name("RULE");
}

tools::CommandLine commandLine() {
  Options options;
  CLI::App app;
  describe(app, options);
  return tools::commandLineOf(app);
}

}  // namespace veltrad::lab
