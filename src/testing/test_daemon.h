// SPDX-License-Identifier: Apache-2.0
// The daemon for tests: the real daemon's listener and connections, with simulated sessions.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/result.h"
#include "ipc/connection.h"
#include "ipc/entitlements.h"
#include "ipc/listener.h"
#include "platform/counters.h"
#include "platform/file_store.h"
#include "platform/lent_files.h"
#include "platform/memory_budget.h"
#include "platform/root.h"
#include "testing/late_answers.h"
#include "testing/script.h"

namespace veltrad::testing {

// A directory below TMPDIR or /tmp, removed with the object.
class TestRoot {
 public:
  // `error` says why there is none.
  static std::optional<TestRoot> make(std::string& error);
  TestRoot(TestRoot&& other) noexcept : _path(std::exchange(other._path, {})) {}
  ~TestRoot();
  const std::string& path() const { return _path; }

 private:
  explicit TestRoot(std::string path) : _path(std::move(path)) {}
  // Empty if it was moved from.
  std::string _path;
};

// start(), restart() and the destructor are for one thread at a time; script() and answers() for any.
class TestDaemon final : public ipc::ListenerDelegate {
 public:
  explicit TestDaemon(TestRoot directory);
  ~TestDaemon() override { stop(); }

  // Starts to serve. Returns the error; absent on success.
  std::optional<std::string> start();
  std::optional<std::string> restart();

  const std::string& root() const { return _directory.path(); }
  Script& script() { return _script; }
  LateAnswers& answers() { return _answers; }

  bool listener(ipc::Listener& listener, const std::shared_ptr<ipc::Connection>& connection) override;

 private:
  void stop();

  const TestRoot _directory;
  const platform::Root _root;
  platform::Counters _counters;
  platform::MemoryBudget _memory;
  platform::LentFiles _lentFiles;
  platform::DiskFileStore _files;
  ipc::Entitlements _entitlements;
  Script _script;
  LateAnswers _answers;
  std::unique_ptr<ipc::Listener> _listener;
};

}  // namespace veltrad::testing
