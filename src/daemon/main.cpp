// SPDX-License-Identifier: Apache-2.0
// veltrad: prepares the process, serves until a signal, and stops in order.
#include <unistd.h>

#include <fmt/format.h>

#include <chrono>
#include <cstdio>
#include <optional>
#include <string_view>
#include <utility>

#include "base/version.h"
#include "daemon/daemon.h"
#include "daemon/doctor.h"
#include "daemon/housekeeping.h"
#include "daemon/observers.h"
#include "ipc/listener.h"
#include "ipc/service_socket.h"
#include "platform/counts_record.h"
#include "platform/log.h"
#include "platform/process_start.h"
#include "platform/run_loop.h"
#include "platform/sandbox.h"
#include "platform/scheduling.h"
#include "platform/state_file.h"

namespace {

using namespace veltrad;
using namespace std::chrono_literals;

// The longest time from the signal to the end of the process.
constexpr auto kStopBound = 10s;
// The part of it that is reserved for the spool to keep unanswered posts.
constexpr std::chrono::milliseconds kTimeToKeep = 3s;
// Connections to the control socket: in all, of one user, and reserved for root and the daemon's own user.
constexpr std::size_t kMostObservers = 64;
constexpr std::size_t kMostObserversOfOneUser = 32;
constexpr std::size_t kObserversForOwner = 2;

constexpr const char* kHelp =
    "Usage: veltrad [--version | --help]\n"
    "\n"
    "Runs in the foreground and serves clients until SIGTERM or SIGINT. Reads its settings from the "
    "environment\n"
    "(VELTRA_ROOT, VELTRA_LOG, VELTRA_LOG_TARGET, VELTRA_SANDBOX) and from the files under etc/veltrad.\n"
    "\n"
    "  --version  Print the version and exit\n"
    "  --help     Print this help and exit\n"
    "\n"
    "Examples:\n"
    "  systemctl start veltrad                           the installed daemon, as a user of its own\n"
    "  VELTRA_ROOT=/tmp/root VELTRA_LOG=debug veltrad    another one, with all its files below /tmp/root\n"
    "\n"
    "See veltrad(8), and veltrad(5) for the files and the environment.\n";

// Before any other thread exists.
void prepareProcess() {
  platform::takeUtilitySchedulingClass();
  platform::shareHeaps();
  platform::VeltraLogging::startLogging("veltrad", "Daemon");
  platform::raiseDescriptorLimit();
}

// Directories must exist before the sandbox is entered.
bool makeDirectories(const platform::Root& root) {
  // These are only read, and may fail: an administrator may add files later, and the sandbox admits only
  // directories that exist now.
  static_cast<void>(platform::makeDirectories(root.configurationDirectory()));
  static_cast<void>(platform::makeDirectories(root.resourcesDirectory()));
  const std::string messageLog = root.messageLogDirectory();
  for (const std::string& directory : {root.runDirectory(), root.preferencesDirectory(), root.logsDirectory(),
                                       messageLog.substr(0, messageLog.rfind('/'))}) {
    if (const auto made = platform::makeDirectories(directory); !made) {
      logError("main: cannot make a directory that the daemon writes to: %s",
               made.error().description.c_str());
      return false;
    }
  }
  return true;
}

// Called after the daemon has taken its lock, because another daemon may be writing the files before.
void removeUnfinishedFiles(const platform::Root& root) {
  for (const std::string& directory :
       {root.runDirectory(), root.stateDirectory(), root.preferencesDirectory(), root.storebagsDirectory()}) {
    const std::size_t removed = platform::removeUnfinishedFiles(directory);
    if (removed > 0) logInfo("main: %zu unfinished files removed from %s", removed, directory.c_str());
  }
}

platform::SandboxState enterSandbox(const platform::Root& root) {
  auto entered = platform::enterSandbox(platform::veltradSandboxProfile(root));
  if (!entered.ok()) {
    logError("main: %s\n", entered.error().c_str());
    _exit(255);
  }
  if (entered.value().inForce) {
    logInfo("main: %s", entered.value().line.c_str());
  } else {
    logWarning("main: %s", entered.value().line.c_str());
  }
  return std::move(entered).value();
}

struct Sockets {
  ipc::ServiceSocket service;
  ipc::ServiceSocket control;
};

Result<Sockets, std::string> openSockets(daemon::Services& services) {
  const auto handedOver = services.serviceManager.handedOverSockets();
  if (!handedOver) return Failure{handedOver.error()};
  auto service = ipc::openServiceSocket(services.root, handedOver.value().service);
  if (!service) return Failure{service.error()};
  auto control = ipc::openControlSocket(services.root, handedOver.value().control);
  if (!control) return Failure{control.error()};
  return Sockets{std::move(service.value()), std::move(control.value())};
}

// Keeps the counts in a file that survives a kill, if it can be made.
void keepCounts(daemon::Services& services, std::optional<platform::CountsRecord>& kept, double started) {
  auto record = platform::CountsRecord::open(services.root.countsPath(), services.files,
                                             services.root.countersPath(), started);
  if (!record) {
    logWarning("main: What a kill would lose cannot be counted: %s", record.error().c_str());
    return;
  }
  kept.emplace(std::move(record).value());
  services.counters.countIn(kept->counts());
  services.allowance.countIn(kept->counts().day);
  if (const auto lost = services.counters.value(wire::Reason::daemon_ended)) {
    logInfo("main: the daemon before this one was killed, and %llu events are lost",
            static_cast<unsigned long long>(lost));
  }
}

platform::StateFile::State countersState(const platform::Counters& counters, double started) {
  return {"The counters", [&counters] { return platform::StateFile::Version{counters.total()}; },
          [&counters, started] { return counters.json(started); }};
}

// This file and the next are not written before anything has left.
platform::StateFile::State allowanceState(const config::DailyAllowance& allowance) {
  return {"The day's account", [&allowance] { return platform::StateFile::Version{allowance.version()}; },
          [&allowance] { return allowance.text(); }, platform::StateFile::Version{}};
}

platform::StateFile::State destinationsState(const config::Destinations& destinations) {
  return {"What left in the last day",
          [&destinations] { return platform::StateFile::Version{destinations.version()}; },
          [&destinations] { return destinations.text(); }, platform::StateFile::Version{}};
}

platform::StateFile::State metricsState(daemon::Observers& observers) {
  const auto version = [&observers] {
    const daemon::Gauges gauges = observers.gauges();
    return platform::StateFile::Version{observers.countsTotal(), gauges.sessions, gauges.connections,
                                        gauges.postsUnderWay, gauges.spoolPosts};
  };
  return {"The metrics", version, [&observers] { return observers.metricsText(); }};
}

void serve(daemon::Housekeeping& housekeeping, platform::RunLoop& loop) {
  loop.run(
      housekeeping.interval(), [&] { housekeeping.tick(); },
      [&] {
        logInfo("main: SIGHUP, configuration is read again");
        housekeeping.readConfigurationAgain();
      });
}

// Stops the listener first, so that every session sends its stop message; then finishes posts and datagrams;
// then writes to the disk, the counters last. False if something still runs, so that nothing may be
// destroyed.
bool stop(daemon::Services& services, daemon::Daemon& daemon, ipc::Listener& listener, ipc::Listener& control,
          const daemon::StateFiles& files) {
  const auto deadline = std::chrono::steady_clock::now() + kStopBound;
  services.serviceManager.stopping();
  services.http.failBlockingWaits();
  daemon.follower().stop();
  daemon.stopSpool();
  std::size_t stuck = listener.invalidate(deadline - 1s);
  stuck += control.invalidate(deadline - 1s);
  services.http.drain(deadline - (daemon.spool() ? kTimeToKeep : 500ms));
  daemon.stopSpool();  // removes what was answered meanwhile
  services.pool.drain(deadline - 300ms);
  if (stuck == 0) services.pool.discard();  // counts the datagrams that still wait
  const bool kept = !daemon.spool() || daemon.spool()->drain(deadline - 300ms);
  services.history.writeNow(deadline - 250ms);
  files.allowance.writeLast(deadline - 200ms);
  files.destinations.writeLast(deadline - 150ms);
  const bool written = files.counters.writeLast(deadline - 100ms);
  if (stuck > 0) logWarning("main: %zu calls did not end within the time of a stop", stuck);
  if (!kept || !written) logWarning("main: the disk did not take everything within the time of a stop");
  return stuck == 0 && kept && written;
}

// Handles the two known arguments. False if there is neither; other arguments are ignored.
bool answerArguments(int count, char** arguments) {
  for (int i = 1; i < count; ++i) {
    const std::string_view argument = arguments[i];
    if (argument == "--version") {
      fmt::print("veltrad {}\n", kVersion);
      return true;
    }
    if (argument == "--help") {
      fmt::print("{}", kHelp);
      return true;
    }
  }
  return false;
}

// What stands before the daemon is made.
struct Prepared {
  daemon::Services& services;
  Sockets sockets;
  platform::SandboxState sandbox;
  std::optional<platform::CountsRecord>& countsRecord;
  double started;
};

// Serves until a signal. Returns the exit status.
int serveAndStop(Prepared prepared, platform::RunLoop& loop) {
  daemon::Services& services = prepared.services;
  services.writer.start();
  const auto stateFile = [&services](platform::StateFile::State state, const std::string& path) {
    return platform::StateFile(std::move(state), services.files, services.writer, path);
  };
  platform::StateFile countersFile =
      stateFile(countersState(services.counters, prepared.started), services.root.countersPath());
  platform::StateFile allowanceFile =
      stateFile(allowanceState(services.allowance), services.root.allowancePath());
  platform::StateFile destinationsFile =
      stateFile(destinationsState(services.destinations), services.root.destinationsPath());
  services.history.mend();
  services.allowance.load();
  services.destinations.load();
  services.gate.refresh();
  daemon::Daemon daemon(services);
  ipc::Listener listener({std::move(prepared.sockets.service), services.entitlements, services.lentFiles,
                          services.counters, services.memory, services.root.entitlementsPath()},
                         daemon.agent());
  daemon::Doctor doctor(services, daemon.settings(), daemon.storebags(), std::move(prepared.sandbox));
  daemon::Observers observers(services, daemon.agent(), listener, doctor, daemon.privacy(), daemon.fates(),
                              daemon.spool(), prepared.started);
  ipc::Listener control({std::move(prepared.sockets.control), services.entitlements, services.lentFiles,
                         services.counters, services.observersMemory, services.root.entitlementsPath(),
                         kMostObservers, kMostObserversOfOneUser, kObserversForOwner, ""},
                        observers);
  platform::StateFile metricsFile = stateFile(metricsState(observers), services.root.metricsPath());
  daemon.startSpool();
  if (!listener.resume() || !control.resume()) {
    services.http.failBlockingWaits();
    daemon.stopSpool();
    services.http.drain(std::chrono::steady_clock::now());
    return 1;
  }
  platform::forbidExit();
  services.serviceManager.ready();
  logInfo("main: Listener resumes with sandbox, start loop.");
  const daemon::StateFiles files{countersFile, metricsFile, allowanceFile, destinationsFile};
  daemon::Housekeeping housekeeping(services, daemon, listener, files);
  serve(housekeeping, loop);
  const bool ended = stop(services, daemon, listener, control, files);
  if (ended && prepared.countsRecord) prepared.countsRecord->told();
  daemon.backends().sayRest();
  platform::VeltraLogging::stopLogging();
  if (!ended) _exit(0);
  platform::allowExit();
  return 0;
}

}  // namespace

int main(int count, char** arguments) {
  platform::openStandardDescriptors();
  platform::keepEnvironment({"VELTRA_ROOT", "VELTRA_LOG", "VELTRA_LOG_TARGET", "VELTRA_SANDBOX", "LC_ALL",
                             "LC_MESSAGES", "LANG", "TZ", "NOTIFY_SOCKET", "LISTEN_PID", "LISTEN_FDS",
                             "LISTEN_FDNAMES", "WATCHDOG_PID", "WATCHDOG_USEC", "JOURNAL_STREAM"});
  if (answerArguments(count, arguments)) return 0;
  prepareProcess();
  platform::RunLoop loop;
  loop.blockSignals();

  // Before the services, which count until they end.
  std::optional<platform::CountsRecord> countsRecord;
  daemon::Services services(platform::Root::fromEnvironment());
  const double started = platform::timevalToSeconds(services.clock.now());
  if (!makeDirectories(services.root)) return 1;
  auto sandbox = enterSandbox(services.root);
  auto sockets = openSockets(services);
  if (!sockets) {
    logError("main: %s", sockets.error().c_str());
    return 1;
  }
  removeUnfinishedFiles(services.root);
  keepCounts(services, countsRecord, started);
  return serveAndStop({services, std::move(sockets.value()), std::move(sandbox), countsRecord, started},
                      loop);
}
