// veltrad: prepare the process, serve until a signal, stop in order. The main thread runs the loop only.
#include <unistd.h>

#include <fmt/format.h>

#include <chrono>
#include <cstdio>
#include <optional>
#include <string_view>

#include "base/version.h"
#include "daemon/daemon.h"
#include "ipc/listener.h"
#include "ipc/service_socket.h"
#include "platform/counters_file.h"
#include "platform/log.h"
#include "platform/process_start.h"
#include "platform/run_loop.h"
#include "platform/sandbox.h"
#include "platform/scheduling.h"

namespace {

using namespace veltrad;
using namespace std::chrono_literals;

constexpr auto kStopBound = 10s;  // from the signal to the end of the process
constexpr auto kTick = 1000ms;  // the watchdog is fed, and counters are handed to the disk writer this often

constexpr const char* kHelp =
    "Usage: veltrad [--version | --help]\n"
    "\n"
    "Runs in the foreground and serves clients until SIGTERM or SIGINT. Reads its settings from the "
    "environment\n"
    "(VELTRA_ROOT, VELTRA_LOG, VELTRA_LOG_TARGET, VELTRA_SANDBOX) and from the files under etc/veltrad.\n"
    "\n"
    "  --version  Print the version and exit\n"
    "  --help     Print this help and exit\n";

// What is written to later must be there before the sandbox closes.
bool makeDirectories(const platform::Root& root) {
  // Not written to, but what an administrator puts there later must be readable then: only what is there now
  // can be let through the sandbox. Where it cannot be made, the file system says that nobody puts anything
  // there.
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

// Where the daemon replaces files. Not before it holds the lock: another daemon's may be under way.
void removeUnfinishedFiles(const platform::Root& root) {
  for (const std::string& directory : {root.runDirectory(), root.preferencesDirectory()}) {
    const std::size_t removed = platform::removeUnfinishedFiles(directory);
    if (removed > 0) logInfo("main: %zu unfinished files removed from %s", removed, directory.c_str());
  }
}

void enterSandbox(const platform::Root& root) {
  const auto entered = platform::enterSandbox(platform::veltradSandboxProfile(root));
  if (!entered.ok()) {
    logError("main: %s\n", entered.error().c_str());
    _exit(255);
  }
  if (entered.value().inForce) {
    logInfo("main: %s", entered.value().line.c_str());
  } else {
    logWarning("main: %s", entered.value().line.c_str());
  }
}

std::optional<ipc::ServiceSocket> openSocket(daemon::Services& services) {
  const auto handedOver = services.serviceManager.handedOverSocket();
  if (!handedOver.ok()) {
    logError("main: %s", handedOver.error().c_str());
    return std::nullopt;
  }
  auto socket = ipc::openServiceSocket(services.root, handedOver.value());
  if (!socket.ok()) {
    logError("main: %s", socket.error().c_str());
    return std::nullopt;
  }
  return std::move(socket).value();
}

void serve(daemon::Services& services, daemon::VeltradAgent& agent, platform::CountersFile& countersFile,
           platform::RunLoop& loop) {
  const auto watchdog = services.serviceManager.watchdogInterval();
  const auto tick = std::min<std::chrono::milliseconds>(watchdog.value_or(kTick), kTick);
  // Connections free their memory after their sessions have gone, each on its own thread.
  constexpr int kTicksToReturnMemory = 3;
  int returns = 0;
  std::uint64_t accepted = 0;
  loop.run(tick, [&] {
    countersFile.writeSoon();
    const bool idle = agent.sessionCount() == 0 && services.http.underWay() == 0;
    // Sessions may come and go between two ticks.
    const std::uint64_t acceptedNow = agent.acceptedSessions();
    if (!idle || acceptedNow != accepted) {
      accepted = acceptedNow;
      returns = kTicksToReturnMemory;
    } else if (returns > 0) {
      --returns;
      platform::returnFreeMemory();
    }
    if (watchdog && services.http.passesEmptyTask(tick)) services.serviceManager.feedWatchdog();
  });
}

// The listener first, so that every session sends its stop message; then what is still to be posted or sent;
// then what that has left for the disk, the counters last. False: something still runs, so nothing may be
// destroyed.
bool stop(daemon::Services& services, ipc::Listener& listener, platform::CountersFile& countersFile) {
  const auto deadline = std::chrono::steady_clock::now() + kStopBound;
  services.serviceManager.stopping();
  services.http.failBlockingWaits();
  const std::size_t stuck = listener.invalidate(deadline - 1s);
  services.http.drain(deadline - 500ms);
  services.pool.drain(deadline - 300ms);
  if (stuck == 0) services.pool.discard();  // which counts the datagrams that still waited
  const bool written = countersFile.writeLast(deadline - 100ms);
  if (stuck > 0) logWarning("main: %zu calls did not end within the time of a stop", stuck);
  if (!written) logWarning("main: the disk did not take everything within the time of a stop");
  return stuck == 0 && written;
}

// Prints what one of the two known arguments asks for. False: there is none, and others are not read.
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

}  // namespace

int main(int count, char** arguments) {
  platform::openStandardDescriptors();
  platform::keepEnvironment({"VELTRA_ROOT", "VELTRA_LOG", "VELTRA_LOG_TARGET", "VELTRA_SANDBOX", "LC_ALL",
                             "LC_MESSAGES", "LANG", "TZ", "NOTIFY_SOCKET", "LISTEN_PID", "LISTEN_FDS",
                             "LISTEN_FDNAMES", "WATCHDOG_PID", "WATCHDOG_USEC", "JOURNAL_STREAM"});
  if (answerArguments(count, arguments)) return 0;
  platform::takeUtilitySchedulingClass();
  platform::shareHeaps();
  platform::VeltraLogging::startLogging("veltrad", "Daemon");
  platform::raiseDescriptorLimit();
  platform::RunLoop loop;
  loop.blockSignals();

  daemon::Services services(platform::Root::fromEnvironment());
  const double started = platform::timevalToSeconds(services.clock.now());
  if (!makeDirectories(services.root)) return 1;
  enterSandbox(services.root);
  auto socket = openSocket(services);
  if (!socket) return 1;
  removeUnfinishedFiles(services.root);

  services.writer.start();  // so that later no thread comes or goes but for clients
  platform::CountersFile countersFile(services.counters, services.files, services.writer,
                                      services.root.countersPath(), started);
  daemon::Daemon daemon(services);
  ipc::Listener listener({std::move(*socket), services.entitlements, services.lentFiles, services.counters,
                          services.memory, services.root.entitlementsPath()},
                         daemon.agent());
  if (!listener.resume()) return 1;
  platform::forbidExit();
  services.serviceManager.ready();
  logInfo("main: Listener resumes with sandbox, start loop.");
  serve(services, daemon.agent(), countersFile, loop);

  const bool ended = stop(services, listener, countersFile);
  daemon.backends().sayRest();
  platform::VeltraLogging::stopLogging();
  if (!ended) _exit(0);
  platform::allowExit();
  return 0;
}
