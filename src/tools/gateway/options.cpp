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

void describeStream(CLI::App& app, StreamArguments& given) {
  app.add_option("--server", given.servers, "A server of the stream; repeat the option for each")
      ->type_name("URL")
      ->allow_extra_args(false)
      ->capture_default_str();
  app.add_option("--stream", given.name, "Name of the stream")
      ->type_name("NAME")
      ->check(&faultOfStreamName)
      ->capture_default_str();
  app.add_option("--prefix", given.prefix, "What stands before each subject, with a dot at its end")
      ->type_name("TEXT")
      ->check(&faultOfPrefix)
      ->capture_default_str();
  app.add_option("--credentials", given.credentials,
                 "File with the credentials of the stream's user: a line NAME:PASSWORD, or what the servers' "
                 "tools write")
      ->type_name("FILE");
  app.add_option("--ca", given.ca, "File with the certificates that sign those of the stream's servers")
      ->type_name("FILE");
}

void describeServing(CLI::App& app, ServeArguments& given) {
  app.add_option("--listen", given.listen,
                 "Where requests are taken: IP:PORT or unix:PATH; port 0: any free one")
      ->type_name("ADDRESS")
      ->capture_default_str();
  app.add_option("--admin", given.admin, "Where /live, /ready and /metrics are answered")
      ->type_name("ADDRESS")
      ->capture_default_str();
  app.add_option("--dashboard", given.dashboard, "Where datagrams are taken: IPv4:PORT; without it none are")
      ->type_name("ADDRESS");
  app.add_option("--copies", given.copies, "Copies that a stream keeps which is made here")
      ->type_name("N")
      ->check(CLI::Range(1, 5))
      ->capture_default_str();
  app.add_option("--stream-bytes", given.streamBytes, "What a stream that is made here may hold; 0: no bound")
      ->type_name("BYTES")
      ->check(CLI::NonNegativeNumber)
      ->capture_default_str();
  app.add_option("--hold", given.hold, "Seconds for which something is held that the stream has not taken")
      ->type_name("SECONDS")
      ->check(CLI::Range(0.1, 60.0))
      ->capture_default_str();
  app.add_option(
         "--hold-bytes", given.holdBytes,
         "What is held together; as much for events from their head to the answer, half of it for the rest")
      ->type_name("BYTES")
      ->check(CLI::Range(kLeastHoldBytes, std::size_t{1} << 40))
      ->capture_default_str();
  app.add_option("--hold-messages", given.holdMessages, "How many messages are held")
      ->type_name("N")
      ->check(CLI::Range(kLeastHoldMessages, std::size_t{1} << 20))
      ->capture_default_str();
  app.add_option("--connections", given.connections, "How many connections are open at once")
      ->type_name("N")
      ->check(CLI::Range(std::size_t{1}, std::size_t{1} << 20))
      ->capture_default_str();
  app.add_option(
         "--shed", given.shed,
         "Status for what cannot be taken. 503 makes a device's back end report nothing until its state is "
         "computed anew, which takes load away for long; 429 does not")
      ->type_name("STATUS")
      ->check(CLI::IsMember({429, 503}))
      ->capture_default_str();
}

void describeDrain(CLI::App& app, Arguments& given) {
  DrainArguments& drain = given.drain;
  app.add_option("--admin", drain.admin, "Where /live, /ready and /metrics are answered")
      ->type_name("ADDRESS")
      ->capture_default_str();
  app.add_option("--database", drain.database, "The database, as libpq takes it [PGHOST and others]")
      ->type_name("DSN");
  app.add_option("--files", drain.files, "Folder of the files that devices have uploaded")
      ->type_name("DIR")
      ->capture_default_str();
  app.add_option("--batch", drain.batch, "Most messages in one transaction")
      ->type_name("N")
      ->check(CLI::Range(1, 10'000))
      ->capture_default_str();
  app.add_option("--statement-timeout", drain.statement,
                 "Seconds that a statement of the database may take; housekeeping has half an hour")
      ->type_name("SECONDS")
      ->check(CLI::Range(0.1, 1'800.0))
      ->capture_default_str();
  app.add_option(
         "--purge-after", drain.purgeAfter,
         "Seconds after which the stream forgets what the tables hold. Servers that start anew learn the IDs "
         "of the last two minutes from what the stream holds")
      ->type_name("SECONDS")
      ->check(CLI::Range(0.0, 1e9))
      ->capture_default_str();
  app.add_option("--post-days", drain.postDays,
                 "Days for which the IDs of posts are kept; at least one more than devices keep posts")
      ->type_name("DAYS")
      ->check(CLI::Range(0.0, 3650.0))
      ->capture_default_str();
  app.add_option("--keep-days", drain.keepDays, "Days for which everything else is kept; 0: for ever")
      ->type_name("DAYS")
      ->check(CLI::Range(0.0, 36500.0))
      ->capture_default_str();
}

}  // namespace

void describe(CLI::App& app, Arguments& given) {
  app.name("veltra-gateway");
  app.description(kAbout);
  tools::useManualStyle(app);
  app.set_version_flag("--version", std::string("veltra-gateway ") + kVersion, "Print the version");
  app.require_subcommand(0, 1);
  describeStream(app, given.stream);
  describeServing(app, given.serve);
  CLI::App* drain =
      app.add_subcommand("drain", "Write what the stream holds to PostgreSQL")->group("Commands");
  describeStream(*drain, given.stream);
  describeDrain(*drain, given);
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
