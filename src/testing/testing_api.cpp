// SPDX-License-Identifier: Apache-2.0
// The C interface.
#include <cstring>
#include <optional>

#include "testing/test_daemon.h"
#include "veltra/testing.h"

struct veltra_testing_daemon {
  veltrad::testing::TestDaemon standIn;
};

veltra_testing_daemon* veltra_testing_start(char** error) {
  if (error) *error = nullptr;
  std::string text;
  if (auto directory = veltrad::testing::TestRoot::make(text)) {
    auto* daemon = new veltra_testing_daemon{veltrad::testing::TestDaemon(std::move(*directory))};
    const auto problem = daemon->standIn.start();
    if (!problem) return daemon;
    delete daemon;
    text = *problem;
  }
  if (error) *error = ::strdup(text.c_str());
  return nullptr;
}

const char* veltra_testing_root(veltra_testing_daemon* daemon) {
  return daemon->standIn.root().c_str();
}

bool veltra_testing_wait(veltra_testing_daemon* daemon, size_t count, uint32_t timeout_ms) {
  return daemon->standIn.script().waitFor(
      count, std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms));
}

size_t veltra_testing_count(veltra_testing_daemon* daemon) {
  return daemon->standIn.script().count();
}

const veltra_value* veltra_testing_message(veltra_testing_daemon* daemon, size_t index) {
  return daemon->standIn.script().message(index);
}

void veltra_testing_refuse(veltra_testing_daemon* daemon, const char* text) {
  daemon->standIn.script().refuse(text ? std::optional<std::string>(text) : std::nullopt);
}

void veltra_testing_delay(veltra_testing_daemon* daemon, uint32_t ms) {
  daemon->standIn.answers().setDelay(std::chrono::milliseconds(ms));
}

bool veltra_testing_restart(veltra_testing_daemon* daemon) {
  return !daemon->standIn.restart();
}

void veltra_testing_stop(veltra_testing_daemon* daemon) {
  delete daemon;
}
