// SPDX-License-Identifier: Apache-2.0
// Listens in a directory of its own.
#include "testing/test_daemon.h"

#include <stdlib.h>

#include <cerrno>
#include <filesystem>
#include <system_error>

#include "testing/simulated_session.h"

namespace veltrad::testing {

namespace {

// The time for running the calls that have arrived.
constexpr std::chrono::seconds kLongestStop{5};

}  // namespace

std::optional<TestRoot> TestRoot::make(std::string& error) {
  const char* given = ::getenv("TMPDIR");
  std::string path = std::string(given && *given ? given : "/tmp") + "/veltra-testing-XXXXXX";
  if (!::mkdtemp(path.data())) {
    error = "No directory could be made as " + path + ": " + std::generic_category().message(errno) + ".";
    return std::nullopt;
  }
  TestRoot made(path);
  std::error_code failure;
  std::filesystem::create_directories(platform::Root(path).runDirectory(), failure);
  if (!failure) return made;
  error = "No directory could be made below " + path + ": " + failure.message() + ".";
  return std::nullopt;
}

TestRoot::~TestRoot() {
  std::error_code ignored;
  if (!_path.empty()) std::filesystem::remove_all(_path, ignored);
}

TestDaemon::TestDaemon(TestRoot directory)
    : _directory(std::move(directory)),
      _root(_directory.path()),
      _entitlements(_files, _root.entitlementsPath()) {}

std::optional<std::string> TestDaemon::start() {
  auto socket = ipc::openServiceSocket(_root, std::nullopt);
  if (!socket) return socket.error();
  ipc::ListenerOptions options{std::move(socket.value()), _entitlements, _lentFiles, _counters, _memory,
                               _root.entitlementsPath()};
  options.entitlement.clear();  // everybody may report
  _listener = std::make_unique<ipc::Listener>(std::move(options), *this);
  if (_listener->resume()) return std::nullopt;
  _listener.reset();
  return "There is no thread or descriptor for accepting connections.";
}

std::optional<std::string> TestDaemon::restart() {
  stop();
  return start();
}

void TestDaemon::stop() {
  if (!_listener) return;
  _listener->invalidate(std::chrono::steady_clock::now() + kLongestStop);
  _listener.reset();
}

bool TestDaemon::listener(ipc::Listener&, const std::shared_ptr<ipc::Connection>& connection) {
  if (const auto text = _script.refusal()) {
    connection->refuse(*text);
    return true;
  }
  connection->setObserver(std::make_shared<SimulatedSession>(_script, _answers));
  connection->resume();
  return true;
}

}  // namespace veltrad::testing
