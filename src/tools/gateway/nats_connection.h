// SPDX-License-Identifier: Apache-2.0
// The connection to the stream's servers, which libnats makes and keeps.
#pragma once

#include <cstdint>
#include <functional>
#include <future>
#include <memory>
#include <string>
#include <vector>

#include "base/result.h"
#include "platform/limited_line.h"

struct __natsConnection;
struct __jsCtx;

namespace veltrad::gateway {

struct StreamOptions {
  // "nats://HOST:PORT"
  std::vector<std::string> servers{"nats://127.0.0.1:4222"};
  std::string name = "VELTRA";
  // The prefix of each subject, with a dot at its end.
  std::string prefix = "veltra.";
  int copies = 3;
  // The maximum size of the stream, beyond which it refuses messages; 0 means no bound.
  std::int64_t mostBytes = 0;
  // Files with a user's credentials (a line "NAME:PASSWORD", or what the servers' own tools write), and with
  // the certificates that the servers' are signed by; empty: none.
  std::string credentials;
  std::string ca;
  // The prefix of the subjects of answers, so that no user needs access to the answers to others.
  std::string inbox = "_INBOX.veltra-gateway";
};

// Closes the connection when it is destroyed. Any thread.
class NATSConnection {
 public:
  // Does not wait for a server to be there. `reconnected`, which must not throw, is called on a thread of the
  // library.
  static Result<std::unique_ptr<NATSConnection>, std::string> open(const StreamOptions& options,
                                                                   std::function<void()> reconnected);
  ~NATSConnection();

  bool connected() const;
  // It will not be connected again, as after two refusals of the user's password in a row: only another one
  // can be.
  bool isOver() const;
  __natsConnection* get() const { return _connection; }
  __jsCtx* jetStream() const { return _jetStream; }

 private:
  friend struct NATSCallbacks;
  NATSConnection() = default;

  __natsConnection* _connection = nullptr;
  __jsCtx* _jetStream = nullptr;
  std::function<void()> _reconnected;
  platform::LimitedLine _faults{"errors"};
  // No callback follows.
  std::promise<void> _closed;
};

}  // namespace veltrad::gateway
