// SPDX-License-Identifier: Apache-2.0
// The options and help texts.
#include "tools/gateway/options.h"

#include <CLI/CLI.hpp>

#include "base/version.h"

namespace veltrad::gateway {
namespace {

constexpr const char* kAbout =
    R"(Takes what devices report and puts it into a stream (NATS JetStream), from which `veltra-gateway drain` writes it to
PostgreSQL. A device is answered 200, or its datagram acknowledged, when the stream has taken what it sent. Any number of
gateways may run side by side; none keeps anything. Prints one JSON line when it is ready, and ends on SIGTERM or SIGINT.

  POST /events, /events/LABEL   an envelope of events; LABEL (a-z, 0-9, "-") is kept with them
  POST /upload?uuid=&sequence=  a gzipped file; the answer is {"success":true}
  POST /logdata                 log data; the answer is the place where it is stored

Put nginx in front of it, which does TLS, limits and rates.)";

constexpr const char* kFooter =
    R"(Exit status: 0 ended as asked; 1 it could not start or go on; 2 usage error.

Examples:
  veltra-gateway --server nats://10.0.0.1:4222 --server nats://10.0.0.2:4222 --dashboard 0.0.0.0:9000
  veltra-gateway drain --database 'dbname=veltra' --files /srv/veltra/files
  curl http://127.0.0.1:8081/metrics)";

// The largest body finds room in half of it, and its pieces, at most 35, beside others.
constexpr std::size_t kLeastHoldBytes = std::size_t{96} << 20;
constexpr std::size_t kLeastHoldMessages = 128;

constexpr const char* kNameCharacters = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789_-";

std::string faultOfStreamName(const std::string& name) {
  return !name.empty() && name.find_first_not_of(kNameCharacters) == std::string::npos
             ? ""
             : "expected letters, digits, \"_\" and \"-\"";
}

std::string faultOfPrefix(const std::string& prefix) {
  const bool good = prefix.size() > 1 && prefix.ends_with('.') && !prefix.starts_with('.') &&
                    prefix.find("..") == std::string::npos &&
                    prefix.find_first_not_of(std::string(kNameCharacters) + ".") == std::string::npos;
  return good ? "" : "expected words with a dot behind each";
}

// Its default, if there is one, is shown in the help.
template <typename T>
CLI::Option* option(CLI::App& app, const char* name, T& value, const char* type, const char* help) {
  return app.add_option(name, value, help)->type_name(type)->capture_default_str();
}

void describeStream(CLI::App& app, StreamOptions& given) {
  option(app, "--server", given.servers, "URL", "A server of the stream; repeat the option for each")
      ->allow_extra_args(false);
  option(app, "--stream", given.name, "NAME", "Name of the stream")->check(&faultOfStreamName);
  option(app, "--prefix", given.prefix, "TEXT", "What stands before each subject, with a dot at its end")
      ->check(&faultOfPrefix);
  option(app, "--credentials", given.credentials, "FILE",
         "File with the credentials of the stream's user: a line NAME:PASSWORD, or what the servers' "
         "tools write");
  option(app, "--ca", given.ca, "FILE", "File with the certificates that sign those of the stream's servers");
}

void describeServing(CLI::App& app, ServeArguments& given, StreamOptions& stream) {
  option(app, "--listen", given.listen, "ADDRESS",
         "Where requests are taken: IP:PORT or unix:PATH; port 0: any free one");
  option(app, "--admin", given.admin, "ADDRESS", "Where /live, /ready and /metrics are answered");
  option(app, "--dashboard", given.dashboard, "ADDRESS",
         "Where datagrams are taken: IPv4:PORT; without it none are");
  option(app, "--copies", stream.copies, "N", "Copies that a stream keeps which is made here")
      ->check(CLI::Range(1, 5));
  option(app, "--stream-bytes", stream.mostBytes, "BYTES",
         "What a stream that is made here may hold; 0: no bound")
      ->check(CLI::NonNegativeNumber);
  option(app, "--hold", given.hold, "SECONDS",
         "Seconds for which something is held that the stream has not taken")
      ->check(CLI::Range(0.1, 60.0));
  option(app, "--hold-bytes", given.holdBytes, "BYTES",
         "What is held together; as much for events from their head to the answer, half of it for the rest")
      ->check(CLI::Range(kLeastHoldBytes, std::size_t{1} << 40));
  option(app, "--hold-messages", given.holdMessages, "N", "How many messages are held")
      ->check(CLI::Range(kLeastHoldMessages, std::size_t{1} << 20));
  option(app, "--connections", given.connections, "N", "How many connections are open at once")
      ->check(CLI::Range(std::size_t{1}, std::size_t{1} << 20));
  option(app, "--shed", given.shed, "STATUS",
         "Status for what cannot be taken. 503 makes a device's back end report nothing until its state is "
         "computed anew, which takes load away for long; 429 does not")
      ->check(CLI::IsMember({429, 503}));
}

void describeDrain(CLI::App& app, DrainArguments& given) {
  option(app, "--admin", given.admin, "ADDRESS", "Where /live, /ready and /metrics are answered");
  option(app, "--database", given.database, "DSN", "The database, as libpq takes it [PGHOST and others]");
  option(app, "--files", given.files, "DIR", "Folder of the files that devices have uploaded");
  option(app, "--batch", given.batch, "N", "Most messages in one transaction")->check(CLI::Range(1, 10'000));
  option(app, "--statement-timeout", given.statement, "SECONDS",
         "Seconds that a statement of the database may take; housekeeping has half an hour")
      ->check(CLI::Range(0.1, 1'800.0));
  option(app, "--purge-after", given.purgeAfter, "SECONDS",
         "Seconds after which the stream forgets what the tables hold. Servers that start anew learn the IDs "
         "of the last two minutes from what the stream holds")
      ->check(CLI::Range(0.0, 1e9));
  option(app, "--post-days", given.postDays, "DAYS",
         "Days for which the IDs of posts are kept; at least one more than devices keep posts")
      ->check(CLI::Range(0.0, 3650.0));
  option(app, "--keep-days", given.keepDays, "DAYS", "Days for which everything else is kept; 0: for ever")
      ->check(CLI::Range(0.0, 36500.0));
}

}  // namespace

void describe(CLI::App& app, Arguments& given) {
  app.name("veltra-gateway");
  app.description(kAbout);
  tools::useManualStyle(app);
  app.set_version_flag("--version", std::string("veltra-gateway ") + kVersion, "Print the version");
  app.require_subcommand(0, 1);
  describeStream(app, given.stream);
  describeServing(app, given.serve, given.stream);
  CLI::App* drain =
      app.add_subcommand("drain", "Write what the stream holds to PostgreSQL")->group("Commands");
  describeStream(*drain, given.stream);
  describeDrain(*drain, given.drain);
  drain->callback([&given] { given.drains = true; });
  app.footer(kFooter);
}

tools::CommandLine commandLine() {
  Arguments given;
  CLI::App app;
  describe(app, given);
  return tools::commandLineOf(app);
}

}  // namespace veltrad::gateway
