// SPDX-License-Identifier: Apache-2.0
// The administration endpoints of a process: /live, /ready, /metrics. They have their own thread, so that
// they answer whatever the rest is doing.
#pragma once

#include <functional>
#include <string>

#include "base/result.h"
#include "base/thread.h"
#include "gateway/http_server.h"

namespace veltrad::gateway {

class Admin {
 public:
  struct Questions {
    // Why the process is not ready; empty: it is.
    std::function<std::string()> notReady;
    // OpenMetrics.
    std::function<std::string()> metrics;
  };

  // The questions are asked on the admin's thread.
  explicit Admin(Questions questions);
  ~Admin();

  // The address with the port that it got.
  Result<std::string, std::string> start(const std::string& address);

 private:
  Answer answer(const RequestHead& head) const;

  const Questions _questions;
  HTTPServer _server;
  Thread _thread;
};

}  // namespace veltrad::gateway
