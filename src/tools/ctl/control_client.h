// SPDX-License-Identifier: Apache-2.0
// Questions to the daemon over its control socket. One thread.
#pragma once

#include <chrono>
#include <cstdint>
#include <string>

#include "base/result.h"
#include "base/value.h"
#include "client/daemon_socket.h"

namespace veltrad::ctl {

class ControlClient {
 public:
  // `root`: absent, VELTRA_ROOT, else "/". The error is one line that says what to do.
  static Result<ControlClient, std::string> connect(const std::optional<std::string>& root);

  // The results, or one line that says why there are none. Waits at most `patience`.
  Result<Dictionary, std::string> ask(const char* question, Dictionary arguments = {},
                                      std::chrono::seconds patience = std::chrono::seconds(30));

 private:
  explicit ControlClient(client::DaemonSocket daemon) : _daemon(std::move(daemon)) {}
  // The body of the reply to the last question; empty: the daemon has gone, or did not answer in time.
  std::optional<Dictionary> reply(std::chrono::steady_clock::time_point deadline);

  client::DaemonSocket _daemon;
  std::uint32_t _lastCall = 0;
};

}  // namespace veltrad::ctl
